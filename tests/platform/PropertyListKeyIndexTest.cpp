#include "platform/PropertyListKeyIndex.h"

#include <gtest/gtest.h>

#include <cstddef>
#include <stdexcept>
#include <string>
#include <vector>

namespace appsync {
namespace {

/// Texts that all have the hash that the test says.
class KeyIndex : public testing::Test {
  protected:
    void add(std::uint32_t hash, const std::string& text) {
        index_.add(hash, texts_.size());
        texts_.push_back(text);
    }
    [[nodiscard]] std::optional<std::size_t> find(std::uint32_t hash, std::string_view text) const {
        return index_.find(hash, text, [this](std::size_t i) { return texts_.at(i); });
    }

    PropertyListKeyIndex index_;
    std::vector<std::string> texts_;
};

TEST_F(KeyIndex, TellsTextsOfOneHashApart) {
    for (const char* text : {"a", "b", "c"}) add(7, text);
    EXPECT_EQ(find(7, "a"), 0U);
    EXPECT_EQ(find(7, "c"), 2U);
    EXPECT_EQ(find(7, "d"), std::nullopt);
    EXPECT_EQ(find(8, "a"), std::nullopt);
}

TEST_F(KeyIndex, FindsWhatGoesRoundTheEndOfTheTable) {
    for (const char* text : {"a", "b", "c"}) add(UINT32_MAX, text);
    EXPECT_EQ(find(UINT32_MAX, "c"), 2U);
    EXPECT_EQ(find(UINT32_MAX, "d"), std::nullopt);
}

TEST_F(KeyIndex, FindsTextsOfOneHashAfterOneOfThemIsGone) {
    for (const char* text : {"a", "b", "c"}) add(7, text);
    index_.erase(1);
    texts_.erase(texts_.begin() + 1);
    EXPECT_EQ(find(7, "a"), 0U);
    EXPECT_EQ(find(7, "b"), std::nullopt);
    EXPECT_EQ(find(7, "c"), 1U);
}

TEST_F(KeyIndex, KeepsNothingOfWhatIsGone) {
    add(0, "first");
    for (std::uint32_t i = 1; i <= 1000; ++i) {
        add(i, "second");
        index_.erase(1);
        texts_.pop_back();
    }
    EXPECT_EQ(find(0, "first"), 0U);
    EXPECT_EQ(find(0, "second"), std::nullopt);
    EXPECT_EQ(find(1000, "second"), std::nullopt);
}

TEST_F(KeyIndex, IsEmptyAgainWhenAllAreGone) {
    EXPECT_TRUE(index_.empty());
    add(1, "a");
    EXPECT_FALSE(index_.empty());
    index_.erase(0);
    EXPECT_TRUE(index_.empty());
}

TEST(HashKeys, AreOfFourRandomNumbers) {
    std::uint32_t last = 0;
    const auto key = PropertyListKeyIndex::drawHashKey([&last] { return ++last; });
    EXPECT_EQ(key, (PropertyListKeyIndex::HashKey{0x0000000100000002U, 0x0000000300000004U}));
}

TEST(HashKeys, AreMadeOfTheClockWhereThereIsNoRandomNumber) {
    const auto none = []() -> std::uint32_t { throw std::runtime_error("no entropy"); };
    const auto key = PropertyListKeyIndex::drawHashKey(none);
    EXPECT_NE(key.first, 0U);
    EXPECT_NE(key.second, 0U);
}

TEST(Hashes, AreTheSameForTheSameText) {
    const std::string text = "com.example.application";
    EXPECT_EQ(PropertyListKeyIndex::hashOf(text), PropertyListKeyIndex::hashOf(std::string(text)));
}

TEST(Hashes, DifferWhereverTextsDiffer) {
    // Each length up to two words, each byte of it changed.
    for (std::size_t length = 1; length <= 17; ++length) {
        const std::string text(length, 'x');
        EXPECT_NE(PropertyListKeyIndex::hashOf(text), PropertyListKeyIndex::hashOf(text + 'x'));
        for (std::size_t i = 0; i < length; ++i) {
            std::string other = text;
            other[i] = 'y';
            EXPECT_NE(PropertyListKeyIndex::hashOf(text), PropertyListKeyIndex::hashOf(other));
        }
    }
}

}  // namespace
}  // namespace appsync
