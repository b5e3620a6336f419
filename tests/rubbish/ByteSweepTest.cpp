// Each byte of small good files replaced by other values, and the files cut off at each byte. The
// short form takes all 256 values where the reader is quick and a choice of them elsewhere; with
// APPSYNC_RUBBISH=all it is every value of every byte for every reader.

#include <gtest/gtest.h>

#include <algorithm>
#include <array>
#include <cstdlib>
#include <ostream>
#include <string>
#include <string_view>
#include <vector>

#include "fuzz/readers/FileReaders.h"
#include "fuzz/readers/PluginReaders.h"
#include "tests/rubbish/Limits.h"
#include "tests/rubbish/SmallFiles.h"

namespace appsync {
namespace {

enum class Pace { Quick, Slow };

/// A kind of file, and what reads it.
struct Kind {
    const char* name;
    Bytes (*makeFile)();
    Reader read;
    Pace pace;
};

std::ostream& operator<<(std::ostream& out, const Kind& kind) { return out << kind.name; }

template <Reading (*Read)(ByteView, Installs)>
constexpr Reader direct() {
    return readOnDevice<Read, Installs::Direct>;
}
template <Reading (*Read)(ByteView, Installs)>
constexpr Reader coordinated() {
    return readOnDevice<Read, Installs::Coordinated>;
}

const std::array kKinds = {
    Kind{"XmlList", smallXmlList, readXmlList, Pace::Quick},
    Kind{"BinaryList", smallBinaryList, readBinaryList, Pace::Quick},
    Kind{"JsonList", smallJsonList, readJsonList, Pace::Quick},
    Kind{"Package", smallPackage, readPackage, Pace::Slow},
    Kind{"DataArchive", smallDataArchive, readDataArchive, Pace::Slow},
    Kind{"Icon", smallIcon, readIcon, Pace::Slow},
    Kind{"Manifest", smallManifest, readManifest, Pace::Quick},
    Kind{"Recording", smallRecording, readSessionRecording, Pace::Quick},
    Kind{"LibraryIndex", smallLibraryIndex, readLibraryIndex, Pace::Quick},
    Kind{"TodoList", smallTodoList, direct<readTodoList>(), Pace::Slow},
    Kind{"CoordinatedTodoList", smallTodoList, coordinated<readTodoList>(), Pace::Slow},
    Kind{"IconOrder", smallIconOrder, direct<readIconOrder>(), Pace::Slow},
    Kind{"RestoreInfo", smallRestoreInfo, direct<readRestoreInfo>(), Pace::Slow},
    Kind{"CoordinatedRestoreInfo", smallRestoreInfo, coordinated<readRestoreInfo>(), Pace::Slow},
    Kind{"DemotedApps", smallDemotedApps, coordinated<readDemotedApps>(), Pace::Slow},
    Kind{"RestoreState", smallRestoreState, direct<readRestoreState>(), Pace::Slow},
    Kind{"StoreMetadata", smallStoreMetadata, direct<readStoreMetadata>(), Pace::Slow},
};

bool takesAllValues(Pace pace) {
    const char* wish = std::getenv("APPSYNC_RUBBISH");
    if (wish != nullptr && std::string_view(wish) == "all") return true;
    return pace == Pace::Quick && !isSanitized();
}

/// Other values of a byte at a position. The choice: the ends of the range, one bit turned, and one
/// that goes through all values as the positions go by.
std::vector<std::uint8_t> valuesFor(std::uint8_t value, std::size_t position, Pace pace) {
    std::vector<std::uint8_t> values;
    if (takesAllValues(pace)) {
        for (unsigned other = 0; other < 256; ++other) {
            values.push_back(static_cast<std::uint8_t>(other));
        }
    } else {
        const auto turned = static_cast<std::uint8_t>(value ^ (1U << (position % 8)));
        values = {turned, static_cast<std::uint8_t>(position * 37 + 11)};
        if (pace == Pace::Quick || !isSanitized()) values.insert(values.end(), {0x00, 0xff});
    }
    std::erase(values, value);
    return values;
}

class ByteSweep : public testing::TestWithParam<Kind> {
  protected:
    /// The report of a run says how many inputs it has tried.
    void TearDown() override { RecordProperty("inputs", std::to_string(read_ + refused_)); }

    /// False when something did not hold: one such input is told, not thousands.
    [[nodiscard]] bool holds(ByteView bytes) {
        const Limits limits;
        const Reading reading = GetParam().read(bytes);
        ++(reading.wasRead ? read_ : refused_);
        broken_ = reading.broken.empty() ? limits.exceeded() : reading.broken;
        return broken_.empty();
    }

    const Bytes file_ = GetParam().makeFile();
    std::string broken_;
    std::size_t read_ = 0;
    std::size_t refused_ = 0;
};

TEST_P(ByteSweep, BeginsWithAFileThatIsGoodAndSmall) {
    EXPECT_TRUE(holds(file_)) << broken_;
    EXPECT_EQ(read_, 1U);
    EXPECT_GE(file_.size(), 50U);
    EXPECT_LE(file_.size(), 700U);
}

TEST_P(ByteSweep, OfEachByteEndsInAReadingOrARefusal) {
    Bytes bytes = file_;
    for (std::size_t position = 0; position < bytes.size(); ++position) {
        const std::uint8_t value = bytes[position];
        for (const std::uint8_t other : valuesFor(value, position, GetParam().pace)) {
            bytes[position] = other;
            ASSERT_TRUE(holds(bytes))
                << "byte " << position << " replaced by " << int{other} << ": " << broken_;
        }
        bytes[position] = value;
    }
    EXPECT_GT(refused_, 0U);
}

TEST_P(ByteSweep, OfEachTruncationEndsInAReadingOrARefusal) {
    for (std::size_t size = 0; size < file_.size(); ++size) {
        ASSERT_TRUE(holds(ByteView(file_).first(size)))
            << "cut off after " << size << " bytes: " << broken_;
    }
    EXPECT_GT(refused_, 0U);
}

INSTANTIATE_TEST_SUITE_P(Rubbish, ByteSweep, testing::ValuesIn(kKinds),
                         [](const auto& kind) { return std::string(kind.param.name); });

}  // namespace
}  // namespace appsync
