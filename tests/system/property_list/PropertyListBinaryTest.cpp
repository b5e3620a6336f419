#include <gtest/gtest.h>

#include <algorithm>

#include "tests/system/property_list/PropertyListSamples.h"

namespace appsync {
namespace {

using namespace std::string_literals;
using namespace std::string_view_literals;

std::string binaryProblem(const Bytes& bytes) {
    const std::string all = refusal(bytes);
    const std::string_view prefix = "binary property list, ";
    return all.starts_with(prefix) ? all.substr(prefix.size()) : all;
}

/// The one object of a list, which begins at offset 8.
Bytes single(std::string_view object) { return BinaryList().add(object).bytes(); }

std::size_t occurrences(const Bytes& bytes, std::string_view text) {
    const std::string all = textOf(bytes);
    std::size_t count = 0;
    for (std::size_t at = all.find(text); at != std::string::npos; at = all.find(text, at + 1)) {
        ++count;
    }
    return count;
}

TEST(BinaryPropertyListWriter, WritesVersionOnePointZero) {
    EXPECT_EQ(textOf(binary(true)).substr(0, 8), "bplist00");
    const auto trailer = BinaryList::number(0, 6) + "\1\1"s + BinaryList::number(1, 8) +
                         BinaryList::number(0, 8) + BinaryList::number(9, 8);
    EXPECT_EQ(textOf(binary(true)), "bplist00\x09\x08"s + trailer);
}

TEST(BinaryPropertyListWriter, WritesEachDistinctStringOnce) {
    const std::string text = "com.example.application";
    const auto list = PropertyList::array(
        {text, text, PropertyList::map({{text, text}}), PropertyList::map({{text, "other"}})});
    EXPECT_EQ(occurrences(binary(list), text), 1U);
    EXPECT_EQ(roundTrip(list, PropertyListFormat::Binary), list);
}

TEST(BinaryPropertyListWriter, UsesTheSmallestWidths) {
    const auto objectSize = [](const PropertyList& value) { return binary(value).size() - 8 - 33; };
    EXPECT_EQ(objectSize(255), 2U);
    EXPECT_EQ(objectSize(256), 3U);
    EXPECT_EQ(objectSize(65536), 5U);
    EXPECT_EQ(objectSize(4294967296), 9U);
    EXPECT_EQ(objectSize(-1), 9U);
    EXPECT_EQ(objectSize(UINT64_MAX), 17U);
    EXPECT_EQ(objectSize(0.5), 5U);
    EXPECT_EQ(objectSize(0.1), 9U);
    EXPECT_EQ(objectSize("ascii"), 6U);
    EXPECT_EQ(objectSize("\u00fc"), 3U);
    EXPECT_EQ(objectSize(std::string(15, 'x')), 18U);
}

TEST(BinaryPropertyListWriter, WidensReferencesWithTheNumberOfObjects) {
    const auto referenceWidth = [](int count) {
        PropertyList list = PropertyList::array();
        for (int i = 0; i < count; ++i) list.append(i);
        const Bytes bytes = binary(list);
        EXPECT_EQ(*parse(bytes), list);
        return bytes[bytes.size() - 32 + 7];
    };
    EXPECT_EQ(referenceWidth(255), 1);
    EXPECT_EQ(referenceWidth(256), 2);
    EXPECT_EQ(referenceWidth(65535), 2);
    EXPECT_EQ(referenceWidth(65536), 3);
}

TEST(BinaryPropertyListWriter, RefusesLongKeysThatNoReaderWouldTake) {
    PropertyList list = PropertyList::array();
    for (int i = 0; i < 3000; ++i) list.append(PropertyList::map({{std::string(4000, 'k'), true}}));
    const auto result = serialize(list, PropertyListFormat::Binary);
    ASSERT_FALSE(result.ok());
    EXPECT_NE(result.error().description().find("write it as XML"), std::string::npos);
    EXPECT_EQ(roundTrip(list, PropertyListFormat::Xml), list);
}

TEST(BinaryPropertyListReader, ReadsEveryWidthOfIntegers) {
    EXPECT_EQ(*parse(single("\x10\xFF")), PropertyList(255));
    EXPECT_EQ(*parse(single("\x11\xFF\xFF")), PropertyList(65535));
    EXPECT_EQ(*parse(single("\x12\xFF\xFF\xFF\xFF")), PropertyList(4294967295U));
    EXPECT_EQ(*parse(single("\x13" + BinaryList::number(UINT64_MAX, 8))), PropertyList(-1));
    EXPECT_EQ(*parse(single("\x14" + BinaryList::number(0, 8) + BinaryList::number(UINT64_MAX, 8))),
              PropertyList(UINT64_MAX));
    EXPECT_EQ(*parse(single("\x14" + BinaryList::number(UINT64_MAX, 8) +
                            BinaryList::number(UINT64_MAX, 8))),
              PropertyList(-1));
}

TEST(BinaryPropertyListReader, ReadsBothWidthsOfReals) {
    EXPECT_EQ(*parse(single("\x22\x3F\x00\x00\x00"s)), PropertyList(0.5));
    EXPECT_EQ(*parse(single("\x23\x3F\xE0\x00\x00\x00\x00\x00\x00"s)), PropertyList(0.5));
}

TEST(BinaryPropertyListReader, ReadsWideReferencesAndLaterMinorVersions) {
    Bytes bytes = BinaryList().referenceWidth(3).add("\xA1\x00\x00\x01"s).add("\x09").bytes();
    EXPECT_EQ(*parse(bytes), PropertyList::array({true}));
    bytes[7] = '1';
    EXPECT_EQ(*parse(bytes), PropertyList::array({true}));
}

TEST(BinaryPropertyListReader, KeysThatMapsShareAtTheSamePlacesAreEachMapsOwn) {
    const std::string longKey(100, 'k');
    const auto pair = [](std::string_view first, std::string_view second) {
        return PropertyList::map({{first, 1}, {second, PropertyList::map({{second, 2}})}});
    };
    const auto list = PropertyList::array({pair("a", "b"), pair("a", "b"), pair("b", "a"),
                                           PropertyList::map({{"b", true}}), pair(longKey, "b"),
                                           pair("a", longKey), pair("a", "b")});
    EXPECT_EQ(roundTrip(list, PropertyListFormat::Binary), list);
}

TEST(BinaryPropertyListReader, RefusesAKeyThatIsRepeatedAfterMapsWithTheSameKeys) {
    // An array of a good map (a, b) and of one in which b is followed by another b.
    const Bytes bytes = BinaryList()
                            .add("\xA2\x01\x02")
                            .add("\xD2\x03\x04\x06\x06")
                            .add("\xD2\x04\x05\x06\x06")
                            .add(
                                "\x51"
                                "a")
                            .add(
                                "\x51"
                                "b")
                            .add(
                                "\x51"
                                "b")
                            .add("\x09")
                            .bytes();
    EXPECT_EQ(binaryProblem(bytes), "offset 18: expected a key that the map does not have yet");
}

TEST(BinaryPropertyListReader, RefusesTheGreatestReferenceAsAKey) {
    const Bytes bytes =
        BinaryList()
            .referenceWidth(8)
            .add("\xD1" + BinaryList::number(UINT64_MAX, 8) + BinaryList::number(1, 8))
            .add("\x09")
            .bytes();
    EXPECT_EQ(binaryProblem(bytes).substr(0, 10), "offset 9: ");
}

TEST(BinaryPropertyListReader, RefusesOtherVersions) {
    EXPECT_EQ(refusal("bplist99xxxxxxxxxxxxxxxxxxxxxxxxxxxxxxxxxxxxxxxxxxx"),
              "binary property list, offset 6: expected version 0 ('bplist00')");
}

TEST(BinaryPropertyListReader, KeepsFractionsOfTheSecondsOfDates) {
    for (const double seconds : {730000000.25, 0.1, 1e-7, -0.3}) {
        const PropertyList date = PropertyList::Date{seconds};
        EXPECT_EQ(roundTrip(date, PropertyListFormat::Binary), date) << seconds;
    }
}

TEST(BinaryPropertyListReader, RefusesDatesThatAreNoPointInTime) {
    for (const std::string_view bits : {"\x7f\xf8"sv, "\xff\xf8"sv, "\x7f\xf0"sv, "\xff\xf0"sv}) {
        EXPECT_EQ(binaryProblem(single("\x33" + std::string(bits) + std::string(6, '\0'))),
                  "offset 8: expected a date, found one that is no point in time");
    }
}

TEST(BinaryPropertyListWriter, RefusesDatesThatAreNoPointInTime) {
    for (const double seconds :
         {std::numeric_limits<double>::quiet_NaN(), -std::numeric_limits<double>::infinity()}) {
        const auto result = serialize(PropertyList::array({PropertyList::Date{seconds}}),
                                      PropertyListFormat::Binary);
        ASSERT_FALSE(result.ok()) << seconds;
        EXPECT_EQ(result.error().description(),
                  "the value at [0]: the date is no point in time; remove it");
    }
}

TEST(BinaryPropertyListReader, RefusesObjectsThatAreNoValues) {
    const std::string expected =
        "offset 8: expected a value (boolean, integer, real, date, data, string, array or map), "
        "found an object of kind ";
    EXPECT_EQ(binaryProblem(single("\0"s)), expected + "0");
    EXPECT_EQ(binaryProblem(single("\x0F")), expected + "15");
    EXPECT_EQ(binaryProblem(single("\x80\x01")), expected + "128");
    EXPECT_EQ(binaryProblem(single("\xC0")), expected + "192");
    EXPECT_EQ(binaryProblem(single("\xFF")), expected + "255");
    EXPECT_EQ(binaryProblem(single("\x15")),
              "offset 8: expected an integer of 1, 2, 4, 8 or 16 bytes");
    EXPECT_EQ(binaryProblem(single("\x21\x00\x00"s)),
              "offset 8: expected a real number of 4 or 8 bytes");
}

TEST(BinaryPropertyListReader, RefusesIntegersAbove64Bits) {
    EXPECT_EQ(binaryProblem(single("\x14" + BinaryList::number(1, 8) + BinaryList::number(0, 8))),
              "offset 8: expected an integer of at most 64 bits");
    EXPECT_EQ(binaryProblem(
                  single("\x14" + BinaryList::number(UINT64_MAX, 8) + BinaryList::number(0, 8))),
              "offset 8: expected an integer of at most 64 bits");
}

TEST(BinaryPropertyListReader, RefusesClaimsBeyondTheInput) {
    EXPECT_EQ(binaryProblem(single("\x13\x00"s)),
              "offset 9: expected 8 more bytes before the offset table, found 1");
    EXPECT_EQ(binaryProblem(single("\x33")),
              "offset 9: expected 8 more bytes before the offset table, found 0");
    EXPECT_EQ(binaryProblem(single("\x55"
                                   "abc")),
              "offset 8: expected a count that 3 bytes before the offset table can hold, found 5");
    EXPECT_EQ(binaryProblem(single("\x4F\x13" + BinaryList::number(UINT64_MAX, 8))),
              "offset 8: expected a count that 0 bytes before the offset table can hold, found "
              "18446744073709551615");
    EXPECT_EQ(binaryProblem(single("\x6F\x13" + BinaryList::number(std::uint64_t{1} << 63U, 8))),
              "offset 8: expected a count that 0 bytes before the offset table can hold, found "
              "9223372036854775808");
    EXPECT_EQ(binaryProblem(single("\xDF\x12\x7F\xFF\xFF\xFF")),
              "offset 8: expected a count that 0 bytes before the offset table can hold, found "
              "2147483647");
    EXPECT_EQ(binaryProblem(single("\xAF\x09")),
              "offset 9: expected a count, an integer of 1, 2, 4 or 8 bytes");
    EXPECT_EQ(binaryProblem(single("\xAF")),
              "offset 9: expected 1 more bytes before the offset table, found 0");
}

TEST(BinaryPropertyListReader, RefusesTextsInTheWrongEncoding) {
    EXPECT_EQ(binaryProblem(single("\x53"
                                   "a\xC3\xBC")),
              "offset 10: expected an ASCII character");
    EXPECT_EQ(binaryProblem(single("\x62\x00\x61\xD8\x3D"s)),
              "offset 11: expected UTF-16, found half of a surrogate pair");
    EXPECT_EQ(binaryProblem(single("\x62\xDE\x00\xD8\x3D"s)),
              "offset 9: expected UTF-16, found half of a surrogate pair");
    EXPECT_EQ(binaryProblem(single("\x62\xD8\x3D\x00\x61"s)),
              "offset 9: expected UTF-16, found half of a surrogate pair");
}

TEST(BinaryPropertyListReader, RefusesReferencesThatLeadNowhere) {
    EXPECT_EQ(binaryProblem(BinaryList().add("\xA1\x05").bytes()),
              "offset 9: expected the number of an object below 1, found 5");
    EXPECT_EQ(binaryProblem(BinaryList().add("\x09").top(1).bytes()),
              "offset 27: expected the number of an object below 1, found 1");
    EXPECT_EQ(
        binaryProblem(BinaryList().add("\x09").offsetOf(0, 7).bytes()),
        "offset 9: expected the offset of an object, between the header and the offset table, "
        "found 7");
    EXPECT_EQ(
        binaryProblem(BinaryList().add("\x09").offsetOf(0, 9).bytes()),
        "offset 9: expected the offset of an object, between the header and the offset table, "
        "found 9");
}

TEST(BinaryPropertyListReader, RefusesATrailerThatDoesNotFit) {
    EXPECT_EQ(binaryProblem(bytesOf("bplist00")),
              "offset 8: expected at least 42 bytes, found the end");
    EXPECT_EQ(
        binaryProblem(BinaryList().add("\x09").objectCount(2).bytes()),
        "offset 19: expected the number of objects, one for each 2 bytes of the offset table");
    EXPECT_EQ(
        binaryProblem(BinaryList().add("\x09").objectCount(UINT64_MAX / 2).bytes()),
        "offset 19: expected the number of objects, one for each 2 bytes of the offset table");
    Bytes bytes = single("\x09");
    const auto with = [&bytes](std::size_t at, std::uint8_t value) {
        Bytes changed = bytes;
        changed[at] = value;
        return binaryProblem(changed);
    };
    EXPECT_EQ(with(17, 0), "offset 17: expected the width of an offset, 1 to 8");
    EXPECT_EQ(with(17, 9), "offset 17: expected the width of an offset, 1 to 8");
    EXPECT_EQ(with(18, 0), "offset 18: expected the width of a reference, 1 to 8");
    EXPECT_EQ(with(42, 8),
              "offset 35: expected the place of the offset table, between the header "
              "and the trailer");
    EXPECT_EQ(with(35, 0xFF),
              "offset 35: expected the place of the offset table, between the "
              "header and the trailer");
}

TEST(BinaryPropertyListReader, RefusesKeysThatAreNoStringsOrEqual) {
    EXPECT_EQ(binaryProblem(BinaryList().add("\xD1\x01\x01").add("\x09").bytes()),
              "offset 11: expected a string, the key of an entry");
    EXPECT_EQ(binaryProblem(BinaryList()
                                .add("\xD2\x01\x02\x03\x03")
                                .add("\x51"
                                     "a")
                                .add("\x51"
                                     "a")
                                .add("\x09")
                                .bytes()),
              "offset 10: expected a key that the map does not have yet");
}

TEST(BinaryPropertyListReader, RefusesContainersInsideThemselves) {
    EXPECT_EQ(binaryProblem(BinaryList().add("\xA1\x00"s).bytes()),
              "offset 8: expected a container that is not inside itself");
    EXPECT_EQ(binaryProblem(BinaryList()
                                .add("\xA1\x01")
                                .add("\xD1\x02\x00"s)
                                .add("\x51"
                                     "a")
                                .bytes()),
              "offset 8: expected a container that is not inside itself");
}

TEST(BinaryPropertyListReader, ReadsSharedObjects) {
    const Bytes bytes = BinaryList()
                            .add("\xA3\x01\x01\x02")
                            .add("\xA2\x02\x03")
                            .add("\x09")
                            .add(
                                "\x51"
                                "a")
                            .bytes();
    const auto inner = PropertyList::array({true, "a"});
    EXPECT_EQ(*parse(bytes), PropertyList::array({inner, inner, true}));
}

BinaryList chain(std::size_t depth, std::string_view reference) {
    BinaryList list;
    for (std::size_t i = 1; i < depth; ++i) {
        std::string object(1, static_cast<char>(0xA0 + reference.size()));
        for (const char c : reference) object += static_cast<char>(c == '+' ? i : 0);
        list.add(object);
    }
    return list.add("\xA0");
}

TEST(BinaryPropertyListReader, EndsAtADepthOf128) {
    EXPECT_EQ(*parse(chain(128, "+").bytes()), nestedArrays(128));
    EXPECT_EQ(binaryProblem(chain(129, "+").bytes()),
              "offset 264: expected at most 128 containers in one another");
}

TEST(BinaryPropertyListReader, DoesNotExpandABillionLaughs) {
    const std::string expected = "expected no more values than an input of this size can hold";
    EXPECT_NE(binaryProblem(chain(30, "++").bytes()).find(expected), std::string::npos);
    EXPECT_NE(binaryProblem(chain(128, "++++++++++++++").bytes()).find(expected),
              std::string::npos);
}

TEST(BinaryPropertyListReader, SharesLongTextsInMemory) {
    // 60,000 references to one text of 60,000 characters: 3.6 GB, if each were a copy.
    const std::string count = "\x11\xEA\x60";
    std::string references;
    for (int i = 0; i < 60000; ++i) references += '\x01';
    const Bytes bytes = BinaryList()
                            .add("\xAF" + count + references)
                            .add("\x5F" + count + std::string(60000, 'x'))
                            .offsetOf(1, 8 + 4 + 60000)
                            .bytes();
    const auto result = parse(bytes);
    ASSERT_EQ(refusal(bytes).substr(0, 60), "read");
    EXPECT_EQ(result->size(), 60000U);
    EXPECT_EQ(result->at(0)->asString(), result->at(59999)->asString());
}

TEST(BinaryPropertyListReader, RefusesTextsThatOverlapToSeemMore) {
    // Each object begins inside the one before it and claims all the rest.
    std::string object;
    for (int i = 0; i < 200; ++i) object += "\x5F\x11\x20\x20";
    object += std::string(0x2020 + 1000, ' ');
    BinaryList list;
    std::string references = "\xAF\x10\xC8";
    for (int i = 1; i <= 200; ++i) references += static_cast<char>(i);
    list.add(references).add(object);
    for (int i = 1; i < 200; ++i) list.add("");
    for (std::size_t i = 0; i < 200; ++i) list.offsetOf(i + 1, 8 + references.size() + i * 4);
    EXPECT_NE(binaryProblem(list.bytes()).find("expected "), std::string::npos);
    EXPECT_NE(binaryProblem(list.bytes()).find("do not overlap"), std::string::npos);
}

TEST(BinaryPropertyListErrors, CarryTheOffsetForPrograms) {
    const auto result = parse(single("\xC0"));
    ASSERT_FALSE(result.ok());
    EXPECT_EQ(result.error().domain, kPropertyListErrorDomain);
    EXPECT_EQ(*result.error().userInfo.find("offset"), PropertyList(8));
}

TEST(BinaryPropertyListDamage, AListCutOffAnywhereIsRefused) {
    const Bytes whole = binary(todoList(5));
    for (std::size_t size = 0; size < whole.size(); ++size) {
        const auto result =
            parse(Bytes(whole.begin(), whole.begin() + static_cast<std::ptrdiff_t>(size)));
        ASSERT_FALSE(result.ok()) << size;
        const std::string text = result.error().description();
        ASSERT_TRUE(text.find("offset ") != std::string::npos || size < 7) << text;
    }
}

TEST(BinaryPropertyListDamage, AnyByteReplacedIsRefusedOrReadAsAValueThatCanBeWritten) {
    const Bytes whole = binary(PropertyList::map(
        {{"k", PropertyList::array({1, 0.5, true, "a", "\u00fc", PropertyList::Date{1}, Bytes{1}})},
         {"m", PropertyList::map({{"k", UINT64_MAX}})}}));
    for (std::size_t i = 7; i < whole.size(); ++i) {
        for (int byte = 0; byte < 256; ++byte) {
            Bytes changed = whole;
            changed[i] = static_cast<std::uint8_t>(byte);
            const auto result = parse(changed);
            if (result) {
                ASSERT_EQ(roundTrip(*result, PropertyListFormat::Binary), *result) << i;
            } else {
                ASSERT_NE(result.error().description().find("offset "), std::string::npos);
            }
        }
    }
}

}  // namespace
}  // namespace appsync
