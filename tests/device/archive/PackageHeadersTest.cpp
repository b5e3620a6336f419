#include <gtest/gtest.h>

#include <string>

#include "device/package/DataArchive.h"
#include "tests/device/package/PackageFixture.h"

namespace appsync {

namespace {

using Code = PackageErrorCode;

constexpr std::uint32_t kElsewhere = 0xffffffff;
constexpr const char* kName = "Atlas.app/one";
constexpr const char* kContents = "the contents of one";
constexpr std::uint64_t kSize = 19;

ZipEntry one() { return zipFile(kName, kContents); }

/// `one`, changed.
template <typename Change>
ZipEntry oneWith(const Change& change) {
    ZipEntry entry = one();
    change(entry);
    return entry;
}

template <typename Change>
ZipEntry streamedWith(const Change& change) {
    ZipEntry entry = zipStreamed(one());
    change(entry);
    return entry;
}

void overwrite(std::string& bytes, std::size_t offset, char value) { bytes.at(offset) = value; }

struct NamedEntry {
    const char* what;
    ZipEntry entry;
    const char* sentence = "";
};

std::ostream& operator<<(std::ostream& out, const NamedEntry& entry) { return out << entry.what; }

class SoundEntryTest : public PackageFixture, public ::testing::WithParamInterface<NamedEntry> {};

TEST_P(SoundEntryTest, isUnpacked) {
    const ZipBuilder archive = atlasWith({GetParam().entry, zipFile("Atlas.app/two", "2")});
    const Status status = unpack(archive);
    ASSERT_TRUE(status.ok()) << status.error().description();
    EXPECT_EQ(read("target/Atlas.app/one"), kContents);
    EXPECT_EQ(read("target/Atlas.app/two"), "2");
}

TEST_P(SoundEntryTest, isUnpackedAsData) {
    write("data.zip", ZipBuilder().add({zipFile("first", "1"), GetParam().entry}).bytes());
    const Status status = verifyDataArchive(path("data.zip"));
    EXPECT_TRUE(status.ok()) << status.error().description();
}

INSTANTIATE_TEST_SUITE_P(
    Descriptors, SoundEntryTest,
    ::testing::Values(
        NamedEntry{"signed, 32 bits", zipStreamed(one())},
        NamedEntry{"bare, 32 bits", zipStreamed(one(), {.hasSignature = false})},
        NamedEntry{"signed, 64 bits", zipStreamed(one(), {.isLarge = true})},
        NamedEntry{"bare, 64 bits", zipStreamed(one(), {.hasSignature = false, .isLarge = true})},
        NamedEntry{"size known before", streamedWith([](auto& e) { e.localSize = kSize; })},
        NamedEntry{"sizes known before",
                   streamedWith([](auto& e) { e.localSize = e.localPackedSize = kSize; })},
        NamedEntry{"everything known before", streamedWith([](auto& e) {
                       e.localSize = e.localPackedSize = std::nullopt;
                       e.localCrc = std::nullopt;
                   })},
        NamedEntry{"room for large sizes", streamedWith([](auto& e) {
                       e.localSize = e.localPackedSize = kElsewhere;
                       e.localExtra = zipLargeSizes({0, 0});
                   })},
        NamedEntry{"one large size known", streamedWith([](auto& e) {
                       e.localSize = e.localPackedSize = kElsewhere;
                       e.localExtra = zipLargeSizes({kSize, 0});
                   })}));

INSTANTIATE_TEST_SUITE_P(
    LargeSizes, SoundEntryTest,
    ::testing::Values(NamedEntry{"in the local header alone", oneWith([](auto& e) {
                                     e.localSize = e.localPackedSize = kElsewhere;
                                     e.localExtra = zipLargeSizes({kSize, kSize});
                                 })},
                      NamedEntry{"in both", oneWith([](auto& e) {
                                     e.localSize = e.localPackedSize = kElsewhere;
                                     e.centralSize = e.centralPackedSize = kElsewhere;
                                     e.localExtra = e.centralExtra = zipLargeSizes({kSize, kSize});
                                 })},
                      NamedEntry{"of one size", oneWith([](auto& e) {
                                     e.centralSize = kElsewhere;
                                     e.centralExtra = zipLargeSizes({kSize});
                                 })},
                      NamedEntry{"of the packed size", oneWith([](auto& e) {
                                     e.centralPackedSize = kElsewhere;
                                     e.centralExtra = zipLargeSizes({kSize});
                                 })},
                      NamedEntry{"of one size that gives both", oneWith([](auto& e) {
                                     e.centralSize = kElsewhere;
                                     e.centralExtra = zipLargeSizes({kSize, kSize});
                                 })},
                      NamedEntry{"that nobody needs", oneWith([](auto& e) {
                                     e.localExtra = e.centralExtra = zipLargeSizes({kSize, kSize});
                                 })}));

INSTANTIATE_TEST_SUITE_P(
    ExtraFields, SoundEntryTest,
    ::testing::Values(NamedEntry{"an empty one", oneWith([](auto& e) {
                                     e.localExtra = e.centralExtra = std::string("\xfe\xca\0\0", 4);
                                 })},
                      NamedEntry{"in the local header alone", oneWith([](auto& e) {
                                     e.localExtra = std::string("UT\5\0\1....", 9);
                                 })},
                      NamedEntry{"of other lengths", oneWith([](auto& e) {
                                     e.localExtra = std::string("UT\x9\0\3........", 13);
                                     e.centralExtra = std::string("UT\5\0\3....", 9);
                                 })},
                      NamedEntry{"longer than most", oneWith([](auto& e) {
                                     e.localExtra =
                                         std::string("xx\x00\x10", 4) + std::string(4096, 'x');
                                 })},
                      NamedEntry{"filled up with zeros",
                                 oneWith([](auto& e) { e.localExtra = std::string(3, '\0'); })}));

class LyingEntryTest : public PackageFixture, public ::testing::WithParamInterface<NamedEntry> {};

TEST_P(LyingEntryTest, isRefusedWhenOpening) {
    const ZipBuilder archive = atlasWith({GetParam().entry, zipFile("Atlas.app/two", "2")});
    EXPECT_TRUE(refused(open(archive), Code::Inconsistent, GetParam().sentence));
}

TEST_P(LyingEntryTest, isRefusedAsData) {
    write("data.zip", ZipBuilder().add({zipFile("first", "1"), GetParam().entry}).bytes());
    EXPECT_TRUE(failedAs(verifyDataArchive(path("data.zip")), Code::Inconsistent));
}

INSTANTIATE_TEST_SUITE_P(
    Headers, LyingEntryTest,
    ::testing::Values(
        NamedEntry{"method", oneWith([](auto& e) { e.localMethod = 8; }),
                   "'Atlas.app/one' has another compression in its own header"},
        NamedEntry{"CRC", oneWith([](auto& e) { e.localCrc = 7; }), "another CRC in its own"},
        NamedEntry{"no CRC", oneWith([](auto& e) { e.localCrc = 0; }), "another CRC"},
        NamedEntry{"no sizes", oneWith([](auto& e) { e.localSize = e.localPackedSize = 0; }),
                   "size"},
        NamedEntry{"packed size", oneWith([](auto& e) { e.localPackedSize = 18; }),
                   "another packed size"},
        NamedEntry{"size beside a descriptor", streamedWith([](auto& e) { e.localSize = 18; }),
                   "another size"},
        NamedEntry{"packed size beside a descriptor",
                   streamedWith([](auto& e) { e.localPackedSize = 1; }), "another packed size"},
        NamedEntry{"CRC beside a descriptor", streamedWith([](auto& e) { e.localCrc = 1; }),
                   "another CRC"},
        NamedEntry{"method beside a descriptor", streamedWith([](auto& e) { e.localMethod = 8; }),
                   "another compression"},
        NamedEntry{"name beside a descriptor",
                   streamedWith([](auto& e) { e.localName = "Atlas.app/eno"; }), "another name"}));

INSTANTIATE_TEST_SUITE_P(
    Descriptors, LyingEntryTest,
    ::testing::Values(
        NamedEntry{"CRC", streamedWith([](auto& e) { overwrite(e.descriptor, 4, '\7'); }),
                   "another CRC after its contents"},
        NamedEntry{"packed size", streamedWith([](auto& e) { overwrite(e.descriptor, 8, '\7'); }),
                   "other sizes"},
        NamedEntry{"size", streamedWith([](auto& e) { overwrite(e.descriptor, 12, '\7'); }),
                   "other sizes"},
        NamedEntry{"signature", streamedWith([](auto& e) { overwrite(e.descriptor, 0, 'Q'); }),
                   "other sizes"},
        NamedEntry{"missing", streamedWith([](auto& e) { e.descriptor.clear(); }), "other sizes"},
        NamedEntry{"cut off", streamedWith([](auto& e) { e.descriptor.pop_back(); }),
                   "other sizes"},
        NamedEntry{"longer than one", streamedWith([](auto& e) { e.descriptor += "x"; }),
                   "other sizes"},
        NamedEntry{"twice", streamedWith([](auto& e) { e.descriptor += e.descriptor; }),
                   "32 bytes after entry 'Atlas.app/one' belong to no entry"},
        NamedEntry{"not announced", streamedWith([](auto& e) {
                       e.flags = 0;
                       e.localCrc = e.localSize = e.localPackedSize = std::nullopt;
                   }),
                   "16 bytes after entry 'Atlas.app/one' belong to no entry"}));

INSTANTIATE_TEST_SUITE_P(
    LargeSizes, LyingEntryTest,
    ::testing::Values(
        NamedEntry{"local size", oneWith([](auto& e) {
                       e.localSize = e.localPackedSize = kElsewhere;
                       e.localExtra = zipLargeSizes({kSize + 1, kSize});
                   }),
                   "another size"},
        NamedEntry{"local size of 2^32 more", oneWith([](auto& e) {
                       e.localSize = e.localPackedSize = kElsewhere;
                       e.localExtra = zipLargeSizes({kSize + (std::uint64_t{1} << 32U), kSize});
                   }),
                   "another size"},
        NamedEntry{"beside a descriptor", streamedWith([](auto& e) {
                       e.localSize = e.localPackedSize = kElsewhere;
                       e.localExtra = zipLargeSizes({kSize, kSize + 1});
                   }),
                   "another packed size"},
        NamedEntry{"that nobody needs", oneWith([](auto& e) {
                       e.centralExtra = zipLargeSizes({kSize, kSize + 1});
                   }),
                   "'Atlas.app/one' has damaged extra fields"},
        NamedEntry{"missing", oneWith([](auto& e) { e.centralSize = kElsewhere; }), "extra fields"},
        NamedEntry{"missing in the local header",
                   oneWith([](auto& e) { e.localSize = e.localPackedSize = kElsewhere; }),
                   "extra fields"},
        NamedEntry{"one of two", oneWith([](auto& e) {
                       e.localSize = e.localPackedSize = kElsewhere;
                       e.localExtra = zipLargeSizes({kSize});
                   }),
                   "extra fields"},
        NamedEntry{"twice", oneWith([](auto& e) {
                       e.localSize = e.localPackedSize = kElsewhere;
                       e.localExtra = zipLargeSizes({kSize, kSize}) + zipLargeSizes({7, 7});
                   }),
                   "extra fields"},
        NamedEntry{"an offset elsewhere in the local header", oneWith([](auto& e) {
                       e.localSize = e.localPackedSize = kElsewhere;
                       e.localExtra = zipLargeSizes({kSize, kSize, 0});
                   }),
                   "extra fields"},
        NamedEntry{"cut off",
                   oneWith([](auto& e) { e.localExtra = std::string("\1\0\x10\0........", 12); }),
                   "extra fields"},
        NamedEntry{"filled up with letters", oneWith([](auto& e) { e.localExtra = "xyz"; }),
                   "extra fields"},
        NamedEntry{"reaching into what follows",
                   oneWith([](auto& e) { e.localPackedSize = e.centralPackedSize = kSize + 1; }),
                   "overlaps what comes after it"},
        NamedEntry{"reaching to the end of numbers", oneWith([](auto& e) {
                       e.localSize = e.localPackedSize = kElsewhere;
                       e.centralSize = e.centralPackedSize = kElsewhere;
                       e.localExtra = e.centralExtra = zipLargeSizes({kSize, ~std::uint64_t{0}});
                   }),
                   "overlaps what comes after it"}));

using PackageHeadersTest = PackageFixture;

ZipEntry hidden(std::string_view contents) {
    ZipEntry entry = zipFile("Atlas.app/hidden", contents);
    entry.isHidden = true;
    return entry;
}

TEST_F(PackageHeadersTest, anEntryThatTheDirectoryHidesIsRefusedWhereverItStands) {
    EXPECT_TRUE(refused(open(ZipBuilder().add(hidden("x")).add(atlasEntries())), Code::Inconsistent,
                        "47 bytes at its beginning belong to no entry"));
    EXPECT_TRUE(refused(open(atlasWith({hidden("x"), one()})), Code::Inconsistent,
                        "47 bytes after entry 'Atlas.app/Atlas' belong to no entry"));
    EXPECT_TRUE(refused(open(atlasWith({one(), hidden("x")})), Code::Inconsistent,
                        "47 bytes after entry 'Atlas.app/one' belong to no entry"));
}

TEST_F(PackageHeadersTest, anEntryThatIsHiddenAfterADescriptorIsRefused) {
    EXPECT_TRUE(refused(open(atlasWith({zipStreamed(one()), hidden("x")})), Code::Inconsistent,
                        "belong to no entry"));
}

TEST_F(PackageHeadersTest, anEntryThatIsHiddenInAnotherIsItsContentsAlone) {
    const std::string inner = ZipBuilder().add(zipFile("Evil.app/x", "x")).bytes();
    ASSERT_TRUE(unpack(atlasWith({zipFile("Atlas.app/inner.zip", inner)})).ok());
    EXPECT_EQ(read("target/Atlas.app/inner.zip"), inner);
}

TEST_F(PackageHeadersTest, bytesThatBelongToNoEntryAreRefused) {
    for (const char* gap : {"x", "a gap of many bytes, more than a descriptor has"}) {
        EXPECT_TRUE(refused(open(ZipBuilder().gap(gap).add(atlasEntries())), Code::Inconsistent,
                            "at its beginning"));
        EXPECT_TRUE(refused(open(atlasWith({}).gap(gap).add(one())), Code::Inconsistent,
                            "after entry 'Atlas.app/Atlas'"));
        EXPECT_TRUE(refused(open(atlasWith({}).gap(gap)), Code::Inconsistent,
                            "after entry 'Atlas.app/Atlas'"));
    }
}

TEST_F(PackageHeadersTest, zerosThatFillUpTheLastRecordOfAPipeAreNothing) {
    const std::string whole = atlasWith({one()}).bytes();
    EXPECT_TRUE(open(whole + std::string(2, '\0')).ok());
    EXPECT_TRUE(open(whole + std::string(10239, '\0')).ok());
    EXPECT_FALSE(open(whole + std::string(10240, '\0')).ok());
    EXPECT_FALSE(open(whole + std::string(100, '\0') + "x").ok());
    EXPECT_FALSE(open(whole + "x" + std::string(100, '\0')).ok());
}

TEST_F(PackageHeadersTest, aGapThatLooksLikeADescriptorIsRefusedWhereNoneIsAnnounced) {
    EXPECT_TRUE(refused(open(atlasWith({one()}).gap(zipStreamed(one()).descriptor)),
                        Code::Inconsistent, "16 bytes after entry 'Atlas.app/one'"));
}

TEST_F(PackageHeadersTest, theEndsOfSmallAndLargeArchivesMustAgree) {
    const std::string whole = atlasWith({}).largeEnd(3).bytes();
    const std::size_t end = whole.rfind("PK\5\6");
    ASSERT_TRUE(open(whole).ok());
    std::string agreeing = whole;
    agreeing.replace(end + 8, 4, std::string("\3\0\3\0", 4));
    EXPECT_TRUE(open(agreeing).ok());
    std::string other = whole;
    other.replace(end + 8, 4, std::string("\4\0\4\0", 4));
    EXPECT_TRUE(refused(open(other), Code::Inconsistent, "contradict"));
}

TEST_F(PackageHeadersTest, bytesBetweenTheDirectoryAndItsEndAreRefused) {
    for (std::string bytes : {atlasWith({}).bytes(), atlasWith({}).largeEnd(3).bytes()}) {
        const std::size_t end = std::min(bytes.rfind("PK\5\6"), bytes.rfind("PK\6\6"));
        EXPECT_FALSE(open(bytes.insert(end, "hidden")).ok());
    }
}

TEST_F(PackageHeadersTest, partsOfAnArchiveAreRefused) {
    const std::string whole = atlasWith({}).bytes();
    const std::size_t end = whole.rfind("PK\5\6");
    for (const std::size_t field : {4U, 6U}) {
        std::string part = whole;
        part[end + field] = '\1';
        EXPECT_TRUE(refused(open(part), Code::Inconsistent, "several parts")) << field;
    }
    std::string entryElsewhere = whole;
    entryElsewhere[whole.rfind("PK\1\2") + 34] = '\1';
    EXPECT_TRUE(refused(open(entryElsewhere), Code::Inconsistent, "in another part"));
}

TEST_F(PackageHeadersTest, packedBytesAfterTheEndOfTheContentsAreDamage) {
    ZipEntry entry = zipZeros("Atlas.app/x", 1000);
    *entry.packed += "hidden";
    EXPECT_TRUE(failedAs(unpack(atlasWith({entry})), Code::DamagedEntry, "more packed bytes"));
}

TEST_F(PackageHeadersTest, packedBytesThatEndTooEarlyAreDamage) {
    ZipEntry entry = zipZeros("Atlas.app/x", 100'000);
    entry.packed->resize(entry.packed->size() / 2);
    EXPECT_TRUE(failedAs(unpack(atlasWith({entry})), Code::DamagedEntry, "end too early"));
}

}  // namespace

}  // namespace appsync
