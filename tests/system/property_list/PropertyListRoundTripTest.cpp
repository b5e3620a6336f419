#include <gtest/gtest.h>

#include <cmath>

#include "system/property_list/PropertyListXmlReader.h"
#include "tests/system/property_list/PropertyListSamples.h"

namespace appsync {
namespace {

class PropertyListRoundTrip : public testing::TestWithParam<PropertyListFormat> {};

INSTANTIATE_TEST_SUITE_P(BothEncodings, PropertyListRoundTrip,
                         testing::Values(PropertyListFormat::Xml, PropertyListFormat::Binary));

TEST_P(PropertyListRoundTrip, KeepsEveryValueOfEveryKind) {
    const auto values = sampleValues();
    for (std::size_t i = 0; i < values.size(); ++i) {
        ASSERT_FALSE(roundTrip(values[i], GetParam()).isNull()) << "sample " << i;
        ASSERT_EQ(roundTrip(values[i], GetParam()), values[i]) << "sample " << i;
    }
}

TEST_P(PropertyListRoundTrip, KeepsAllValuesTogether) {
    PropertyList map = PropertyList::map();
    for (const PropertyList& value : sampleValues()) map.set(std::to_string(map.size()), value);
    EXPECT_EQ(roundTrip(map, GetParam()), map);
}

TEST_P(PropertyListRoundTrip, KeepsTheOrderOfEntries) {
    const auto map = PropertyList::map({{"z", 1}, {"a", 2}, {"m", 3}});
    const PropertyList read = roundTrip(map, GetParam());
    ASSERT_EQ(read.size(), 3U);
    EXPECT_EQ(read.entries()[0].key, "z");
    EXPECT_EQ(read.entries()[1].key, "a");
    EXPECT_EQ(read.entries()[2].key, "m");
}

TEST_P(PropertyListRoundTrip, KeepsRealsApartFromIntegers) {
    EXPECT_EQ(roundTrip(1.0, GetParam()).kind(), PropertyList::Kind::Real);
    EXPECT_EQ(roundTrip(1, GetParam()).kind(), PropertyList::Kind::Integer);
    EXPECT_EQ(roundTrip(1e15, GetParam()).kind(), PropertyList::Kind::Real);
    EXPECT_TRUE(std::signbit(*roundTrip(-0.0, GetParam()).asReal()));
}

TEST_P(PropertyListRoundTrip, KeepsLargeListsAndLargeMaps) {
    const PropertyList list = todoList(2000);
    EXPECT_EQ(roundTrip(list, GetParam()), list);
    PropertyList map = PropertyList::map();
    for (int i = 0; i < 2000; ++i) map.set("key " + std::to_string(i), i);
    EXPECT_EQ(roundTrip(map, GetParam()), map);
}

TEST_P(PropertyListRoundTrip, KeepsMapsOfOneListApart) {
    // Keys and values that change places, kinds and number from one map to the next.
    const auto list = PropertyList::array(
        {PropertyList::map({{"a", "x"}, {"b", "y"}}), PropertyList::map({{"b", "x"}, {"a", "y"}}),
         PropertyList::map({{"a", 1}, {"b", "a"}}), PropertyList::map({{"x", "x"}}), "x",
         PropertyList::map({{"y", PropertyList::map({{"a", "b"}, {"b", "a"}})}, {"a", true}}),
         PropertyList::map(), PropertyList::map({{"a", "x"}, {"b", "y"}, {"c", ""}})});
    EXPECT_EQ(roundTrip(list, GetParam()), list);
}

TEST_P(PropertyListRoundTrip, KeepsTheDeepestNesting) {
    const PropertyList deepest = nestedArrays(PropertyList::kMaximumDepth);
    EXPECT_EQ(roundTrip(deepest, GetParam()).depth(), PropertyList::kMaximumDepth);
    EXPECT_EQ(roundTrip(deepest, GetParam()), deepest);
}

TEST_P(PropertyListRoundTrip, KeepsLongTextsThatRepeat) {
    const PropertyList text = std::string(2000, 'x');
    PropertyList list = PropertyList::array();
    for (int i = 0; i < 2000; ++i) list.append(text);
    EXPECT_EQ(roundTrip(list, GetParam()), list);
}

TEST_P(PropertyListRoundTrip, KeepsLongKeysThatRepeat) {
    PropertyList list = PropertyList::array();
    for (int i = 0; i < 200; ++i) list.append(PropertyList::map({{std::string(900, 'k'), i}}));
    EXPECT_EQ(roundTrip(list, GetParam()), list);
}

TEST_P(PropertyListRoundTrip, TheNullMarkerIsNotWrittenAnywhere) {
    const auto inside = PropertyList::map({{"apps", PropertyList::array({1, PropertyList()})}});
    EXPECT_EQ(serialize(PropertyList(), GetParam()).error().description(),
              "the outermost value: the null marker cannot be written; remove it");
    EXPECT_EQ(serialize(inside, GetParam()).error().description(),
              "the value at [\"apps\"][1]: the null marker cannot be written; remove it");
}

TEST_P(PropertyListRoundTrip, TextThatIsNotUtf8IsNotWritten) {
    for (const std::string bad : {"\xFF", "a\xC3", "\xC0\x80", "\xED\xA0\x80", "\xF4\x90\x80\x80",
                                  "\x80", "\xE2\x28\xA1", "\xF8\x88\x80\x80\x80"}) {
        const auto result = serialize(PropertyList::array({"good", bad}), GetParam());
        ASSERT_FALSE(result.ok());
        EXPECT_EQ(result.error().domain, kPropertyListErrorDomain);
        EXPECT_NE(result.error().description().find("the value at [1]: the text is not UTF-8"),
                  std::string::npos);
    }
}

TEST_P(PropertyListRoundTrip, KeysThatAreNotUtf8AreNotWritten) {
    const auto map = PropertyList::map({{"a\xFF\"", 1}});
    const auto result = serialize(map, GetParam());
    ASSERT_FALSE(result.ok());
    EXPECT_NE(result.error().description().find("[\"a\\xff\\x22\"]: the text is not UTF-8"),
              std::string::npos);
}

// Other writers' files: what they hold, in both encodings.

PropertyList foreignContent() {
    return PropertyList::map({{"text", "plain"},
                              {"wide", "Gr\u00fc\u00dfe \U0001F600"},
                              {"empty", ""},
                              {"yes", true},
                              {"no", false},
                              {"small", 7},
                              {"byte", 255},
                              {"word", 65536},
                              {"negative", -5},
                              {"large", INT64_MAX},
                              {"huge", UINT64_MAX},
                              {"real", 0.5},
                              {"date", PropertyList::Date{730902645}},
                              {"data", Bytes{0, 1, 0xFE, 0xFF}},
                              {"list", PropertyList::array({"plain", PropertyList::array({"x"}),
                                                            PropertyList::map()})}});
}

Bytes fromHexadecimal(std::string_view digits) {
    Bytes bytes;
    for (std::size_t i = 0; i < digits.size(); i += 2) {
        bytes.push_back(
            static_cast<std::uint8_t>(std::stoi(std::string(digits.substr(i, 2)), nullptr, 16)));
    }
    return bytes;
}

TEST(ForeignPropertyLists, BinaryAsAnotherLibraryWritesIt) {
    const Bytes bytes = fromHexadecimal(
        "62706c6973743030df100f0102030405060708090a0b0c0d0e0f101112131415161718191a1b1c1d1e54"
        "74657874547769646555656d70747953796573526e6f55736d616c6c546279746554776f7264586e6567"
        "6174697665556c617267655468756765547265616c54646174655464617461546c69737455706c61696e"
        "680047007200fc00df00650020d83dde00500908100710ff120001000013fffffffffffffffb137fffff"
        "ffffffffff140000000000000000ffffffffffffffff233fe00000000000003341c5c8583a8000004400"
        "01feffa3101f21a1205178d008292e33393d40464b50595f64696e73787e8f90919294969ba4adbec7d0"
        "d5d9dbdd00000000000001010000000000000022000000000000000000000000000000de");
    EXPECT_EQ(refusal(bytes), "read");
    EXPECT_EQ(*parse(bytes), foreignContent());
}

TEST(ForeignPropertyLists, XmlAsAnotherLibraryWritesIt) {
    const std::string text =
        "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n"
        "<!DOCTYPE plist PUBLIC \"-//Example//DTD PLIST 1.0//EN\" \"http://example.com/p.dtd\">\n"
        "<plist version=\"1.0\">\n<dict>\n"
        "\t<key>text</key>\n\t<string>plain</string>\n"
        "\t<key>wide</key>\n\t<string>Gr\u00fc\u00dfe \U0001F600</string>\n"
        "\t<key>empty</key>\n\t<string></string>\n"
        "\t<key>yes</key>\n\t<true/>\n\t<key>no</key>\n\t<false/>\n"
        "\t<key>small</key>\n\t<integer>7</integer>\n"
        "\t<key>byte</key>\n\t<integer>255</integer>\n"
        "\t<key>word</key>\n\t<integer>65536</integer>\n"
        "\t<key>negative</key>\n\t<integer>-5</integer>\n"
        "\t<key>large</key>\n\t<integer>9223372036854775807</integer>\n"
        "\t<key>huge</key>\n\t<integer>18446744073709551615</integer>\n"
        "\t<key>real</key>\n\t<real>0.5</real>\n"
        "\t<key>date</key>\n\t<date>2024-02-29T12:30:45Z</date>\n"
        "\t<key>data</key>\n\t<data>\n\tAAH+/w==\n\t</data>\n"
        "\t<key>list</key>\n\t<array>\n\t\t<string>plain</string>\n"
        "\t\t<array>\n\t\t\t<string>x</string>\n\t\t</array>\n\t\t<dict/>\n\t</array>\n"
        "</dict>\n</plist>\n";
    EXPECT_EQ(refusal(text), "read");
    EXPECT_EQ(*parse(text), foreignContent());
    // The reader for plain documents and the one for all documents agree.
    EXPECT_EQ(*readXmlPropertyList(bytesOf(text)), foreignContent());
}

}  // namespace
}  // namespace appsync
