#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <limits>
#include <string>

#include "contract/SystemContract.h"

namespace appsync {
namespace {

using testing::IsEmpty;
using testing::Not;

class PropertyListContract : public SystemContract {
  protected:
    PropertyListContract() : lists_(system_->propertyLists()) {}

    PropertyListSerialization& lists_;
};

APPSYNC_CONTRACT_SUITE(PropertyListContract, systemPorts());

PropertyList everyKind() {
    return PropertyList::map({{"boolean", true},
                              {"smallest", std::numeric_limits<std::int64_t>::min()},
                              {"largest", std::numeric_limits<std::uint64_t>::max()},
                              {"real", 0.1},
                              {"date", PropertyList::Date{1000}},
                              {"data", Bytes{0, 255}},
                              {"text", "h\u00e9 <&>"},
                              {"array", PropertyList::array({1, PropertyList::map()})}});
}

TEST_P(PropertyListContract, EveryKindComesBackFromBothEncodings) {
    checks("platform/PropertyListSerialization.h", "Reads either encoding, told apart by content.");
    for (const auto format : {PropertyListFormat::Xml, PropertyListFormat::Binary}) {
        const Result<Bytes> written = lists_.serialize(everyKind(), format);
        ASSERT_TRUE(written);
        const Result<PropertyList> read = lists_.parse(*written);
        ASSERT_TRUE(read) << read.error().description();
        EXPECT_EQ(*read, everyKind());
    }
}

TEST_P(PropertyListContract, BinaryIsVersionOne) {
    checks("platform/PropertyListSerialization.h",
           "Writes a value in one of the encodings (binary: version 1.0).");
    const Result<Bytes> written = lists_.serialize("text", PropertyListFormat::Binary);
    ASSERT_TRUE(written);
    EXPECT_EQ(std::string(written->begin(), written->begin() + 8), "bplist00");
}

TEST_P(PropertyListContract, ANullMarkerIsNeverWritten) {
    checks("platform/PropertyListSerialization.h",
           "Fails when the value holds a null marker, or a text that the encoding cannot carry.");
    const PropertyList hidden = PropertyList::map({{"key", PropertyList::array({PropertyList()})}});
    for (const auto format : {PropertyListFormat::Xml, PropertyListFormat::Binary}) {
        const Result<Bytes> written = lists_.serialize(hidden, format);
        ASSERT_FALSE(written);
        EXPECT_EQ(written.error().domain, kPropertyListErrorDomain);
    }
}

TEST_P(PropertyListContract, WhatIsNoPropertyListIsRefusedWithASentence) {
    checks("platform/PropertyListSerialization.h",
           "An error of `kPropertyListErrorDomain` says where (byte offset, or line and column) "
           "and what was expected.");
    for (const std::string text : {"", "bplist00", "<plist", "no list at all"}) {
        const Result<PropertyList> read = lists_.parse(Bytes(text.begin(), text.end()));
        ASSERT_FALSE(read) << text;
        EXPECT_EQ(read.error().domain, kPropertyListErrorDomain);
        EXPECT_THAT(read.error().description(), Not(IsEmpty()));
    }
}

}  // namespace

void linkPropertyListContract() {}

}  // namespace appsync
