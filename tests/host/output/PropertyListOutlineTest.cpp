#include "host/output/PropertyListOutline.h"

#include <gtest/gtest.h>

#include <limits>

#include "host/output/JsonRecords.h"

namespace appsync {
namespace {

TEST(PropertyListOutline, ShowsEachValueOnALineOfItsOwn) {
    const PropertyList value = PropertyList::map({{"list", PropertyList::array({1, "two", true})},
                                                  {"data", Bytes{0xde, 0xad}},
                                                  {"date", PropertyList::Date{0}}});
    EXPECT_EQ(propertyListOutline(value),
              "map of 3\n"
              "  list: list of 3\n"
              "    - 1\n"
              "    - \"two\"\n"
              "    - true\n"
              "  data: data of 2 bytes <dead>\n"
              "  date: date 2001-01-01T00:00:00Z\n");
}

TEST(PropertyListOutline, ShowsWholeNumbersOfBothSigns) {
    EXPECT_EQ(propertyListOutline(std::numeric_limits<std::int64_t>::min()),
              "-9223372036854775808\n");
    EXPECT_EQ(propertyListOutline(std::numeric_limits<std::uint64_t>::max()),
              "18446744073709551615\n");
}

TEST(PropertyListOutline, ShowsWhatBreaksALine) {
    EXPECT_EQ(propertyListOutline("a\nb\t\"c\" \\n"), "\"a\\nb\\t\\\"c\\\" \\\\n\"\n");
    EXPECT_EQ(propertyListOutline("a\x1b[J"), "\"a?[J\"\n");
}

TEST(DateText, SurvivesDatesThatNoCalendarHolds) {
    EXPECT_EQ(dateText({1e300}), "1.0000000000000001e+300 s since 2001");
    EXPECT_EQ(dateText({std::numeric_limits<double>::quiet_NaN()}), "nan s since 2001");
    EXPECT_EQ(dateText({-0.5}), "2000-12-31T23:59:59Z");
    EXPECT_EQ(dateText({-63'113'904'000.0}), "0001-01-01T00:00:00Z");
}

TEST(Base64Text, PadsToWholeGroups) {
    const Bytes bytes = {'M', 'a', 'n', 'y'};
    EXPECT_EQ(base64Text({}), "");
    EXPECT_EQ(base64Text(ByteView(bytes).first(1)), "TQ==");
    EXPECT_EQ(base64Text(ByteView(bytes).first(2)), "TWE=");
    EXPECT_EQ(base64Text(ByteView(bytes).first(3)), "TWFu");
    EXPECT_EQ(base64Text(bytes), "TWFueQ==");
}

TEST(PropertyListJson, KeepsOrderAndMarksWhatJsonLacks) {
    const PropertyList value = PropertyList::map({{"b", Bytes{1}}, {"a", PropertyList::array({})}});
    EXPECT_EQ(jsonText(value), "{\n  \"b\": {\n    \"data\": \"AQ==\"\n  },\n  \"a\": []\n}");
}

}  // namespace
}  // namespace appsync
