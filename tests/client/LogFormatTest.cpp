#include "client/LogFormat.h"

#include <gtest/gtest.h>

#include <array>
#include <string>

#include "platform/PropertyList.h"

namespace appsync {
namespace {

using Kind = LogArgumentKind;

template <std::size_t count>
constexpr std::array<Kind, count> kinds(const Kind (&values)[count]) {
    return std::to_array(values);
}
constexpr std::array<Kind, 0> kNone{};

TEST(LogFormat, NamesTheKindOfEachArgument) {
    EXPECT_EQ(logArgumentKind<char>(), Kind::Character);
    EXPECT_EQ(logArgumentKind<bool>(), Kind::Signed);
    EXPECT_EQ(logArgumentKind<long>(), Kind::Signed);
    EXPECT_EQ(logArgumentKind<unsigned long>(), Kind::Unsigned);
    EXPECT_EQ(logArgumentKind<double>(), Kind::Real);
    EXPECT_EQ(logArgumentKind<std::string>(), Kind::Object);
    EXPECT_EQ(logArgumentKind<const PropertyList*>(), Kind::Object);
}

TEST(LogFormat, FitsWhenEachPlaceHolderHasAnArgumentOfItsKind) {
    EXPECT_TRUE(logFormatFits("no place-holder", kNone));
    EXPECT_TRUE(logFormatFits("%{public}@ is 100%% %c", kinds({Kind::Object, Kind::Character})));
    EXPECT_TRUE(logFormatFits("%d %ld %lld", kinds({Kind::Signed, Kind::Signed, Kind::Signed})));
    EXPECT_TRUE(
        logFormatFits("%u %lu %llu", kinds({Kind::Unsigned, Kind::Unsigned, Kind::Unsigned})));
    EXPECT_TRUE(logFormatFits("%s|%f%lf", kinds({Kind::Object, Kind::Real, Kind::Real})));
}

TEST(LogFormat, RefusesAnArgumentOfAnotherKind) {
    EXPECT_FALSE(logFormatFits("%d", kinds({Kind::Unsigned})));
    EXPECT_FALSE(logFormatFits("%llu", kinds({Kind::Signed})));
    EXPECT_FALSE(logFormatFits("%{public}@", kinds({Kind::Real})));
    EXPECT_FALSE(logFormatFits("%c", kinds({Kind::Signed})));
}

TEST(LogFormat, RefusesAnotherNumberOfArguments) {
    EXPECT_FALSE(logFormatFits("%d", kNone));
    EXPECT_FALSE(logFormatFits("%d", kinds({Kind::Signed, Kind::Signed})));
    EXPECT_FALSE(logFormatFits("100%%", kinds({Kind::Signed})));
}

TEST(LogFormat, RefusesPlaceHoldersThatItDoesNotKnow) {
    EXPECT_FALSE(logFormatFits("%@", kinds({Kind::Object})));
    EXPECT_FALSE(logFormatFits("%x", kinds({Kind::Unsigned})));
    EXPECT_FALSE(logFormatFits("ends with %", kinds({Kind::Object})));
}

}  // namespace
}  // namespace appsync
