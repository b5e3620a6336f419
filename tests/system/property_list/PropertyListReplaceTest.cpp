#include <gtest/gtest.h>

#include <cstddef>
#include <string>
#include <tuple>

#include "platform/PropertyList.h"
#include "system/property_list/PropertyListCodec.h"

namespace appsync {
namespace {

constexpr std::string_view kKey = "operation";

PropertyList entryOf(std::size_t number, std::string_view operation) {
    return PropertyList::map({{"identifier", "com.example." + std::to_string(number)},
                              {std::string(kKey), operation},
                              {"other", PropertyList::array({"SENT", "SENT"})}});
}

PropertyList listOf(std::size_t count) {
    PropertyList list = PropertyList::array();
    for (std::size_t number = 0; number < count; ++number) list.append(entryOf(number, "install"));
    return list;
}

class PropertyListReplace : public testing::Test {
  protected:
    Bytes binary(const PropertyList& list) {
        return *codec_.serialize(list, PropertyListFormat::Binary);
    }
    /// Nothing is replaced, and nothing has changed.
    void expectRefusal(const PropertyList& list, std::size_t index, std::string_view key,
                       std::string_view text) {
        const Bytes before = binary(list);
        Bytes bytes = before;
        EXPECT_FALSE(codec_.replaceText(bytes, index, key, text));
        EXPECT_EQ(bytes, before);
    }

    SystemPropertyLists codec_;
};

TEST_F(PropertyListReplace, ReadsAsTheChangedList) {
    // References of one, two and three bytes.
    for (const std::size_t count : {1U, 40U, 1'000U, 30'000U}) {
        PropertyList list = listOf(count);
        Bytes bytes = binary(list);
        const std::size_t size = bytes.size();
        for (const std::size_t index : {std::size_t{0}, count / 2, count - 1}) {
            ASSERT_TRUE(codec_.replaceText(bytes, index, kKey, "SENT")) << count;
            list.set(index, entryOf(index, "SENT"));
        }
        EXPECT_EQ(*codec_.parse(bytes), list) << count;
        EXPECT_EQ(bytes.size(), size);
        ASSERT_TRUE(codec_.replaceText(bytes, 0, kKey, "install"));
        list.set(0, entryOf(0, "install"));
        EXPECT_EQ(*codec_.parse(bytes), list) << count;
    }
}

TEST_F(PropertyListReplace, ChangesOneOfEqualEntries) {
    Bytes bytes = binary(PropertyList::array({entryOf(1, "install"), entryOf(1, "install")}));
    ASSERT_TRUE(codec_.replaceText(bytes, 1, kKey, "SENT"));
    EXPECT_EQ(*codec_.parse(bytes),
              PropertyList::array({entryOf(1, "install"), entryOf(1, "SENT")}));
}

TEST_F(PropertyListReplace, FindsTheKeyAmongMany) {
    PropertyList entry = entryOf(1, "install");
    for (int number = 0; number < 300; ++number) entry.set("key " + std::to_string(number), number);
    Bytes bytes = binary(PropertyList::array({7, entry}));
    ASSERT_TRUE(codec_.replaceText(bytes, 1, kKey, "SENT"));
    entry.set(kKey, "SENT");
    EXPECT_EQ(*codec_.parse(bytes), PropertyList::array({7, entry}));
}

TEST_F(PropertyListReplace, PutsATextInThePlaceOfAnythingElse) {
    const PropertyList other = PropertyList::map({{"a", "SENT"}});
    Bytes bytes = binary(PropertyList::array({PropertyList::map({{std::string(kKey), 7}}), other}));
    ASSERT_TRUE(codec_.replaceText(bytes, 0, kKey, "SENT"));
    EXPECT_EQ(*codec_.parse(bytes),
              PropertyList::array({PropertyList::map({{std::string(kKey), "SENT"}}), other}));
}

TEST_F(PropertyListReplace, RefusesWhatWouldHaveToBeWrittenAnew) {
    const PropertyList list = listOf(3);
    expectRefusal(list, 0, kKey, "FAILED");
    expectRefusal(list, 0, "operations", "SENT");
    expectRefusal(list, 3, kKey, "SENT");
    expectRefusal(list, 0, kKey, "a text of more than 14");
    expectRefusal(list, 0, "a key of more than 14", "SENT");
    expectRefusal(PropertyList::array({7, "SENT"}), 0, kKey, "SENT");
    expectRefusal(PropertyList::array({"SENT", PropertyList::array({"SENT"})}), 1, kKey, "SENT");
    expectRefusal(entryOf(1, "install"), 0, kKey, "SENT");
    expectRefusal("SENT", 0, kKey, "SENT");
}

TEST_F(PropertyListReplace, RefusesXml) {
    Bytes bytes = *codec_.serialize(listOf(1), PropertyListFormat::Xml);
    EXPECT_FALSE(codec_.replaceText(bytes, 0, kKey, "SENT"));
    Bytes none;
    EXPECT_FALSE(codec_.replaceText(none, 0, kKey, "SENT"));
}

TEST_F(PropertyListReplace, ComesBackFromDamagedBytes) {
    const Bytes sound = binary(listOf(20));
    std::size_t replaced = 0;
    for (std::size_t at = 0; at < sound.size(); ++at) {
        for (const int value : {0x00, 0x0F, 0x13, 0x7F, 0xAF, 0xDF, 0xFF}) {
            Bytes damaged = sound;
            damaged[at] = static_cast<std::uint8_t>(value);
            if (codec_.replaceText(damaged, 19, kKey, "SENT")) ++replaced;
            EXPECT_EQ(damaged.size(), sound.size());
        }
    }
    EXPECT_GT(replaced, 0U);
    for (std::size_t size = 0; size < sound.size(); ++size) {
        Bytes cut(sound.begin(), sound.begin() + static_cast<std::ptrdiff_t>(size));
        std::ignore = codec_.replaceText(cut, 19, kKey, "SENT");
        EXPECT_EQ(cut.size(), size);
    }
}

}  // namespace
}  // namespace appsync
