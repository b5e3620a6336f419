#include "fuzz/readers/FileReaders.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <compare>
#include <cstdint>
#include <filesystem>
#include <string_view>

#include "device/package/DataArchive.h"
#include "device/package/PackageReader.h"
#include "device/screen/IconDrawing.h"
#include "device/values/PackageIdentifier.h"
#include "fuzz/readers/ScratchDirectory.h"
#include "host/backup/Backup.h"
#include "host/console/PropertyListReading.h"
#include "host/file/Checksum.h"
#include "host/output/JsonRecords.h"
#include "host/plan/LibraryIndex.h"
#include "host/plan/Versions.h"
#include "host/replay/RecordingReader.h"
#include "host/replay/RecordingText.h"
#include "system/property_list/PropertyListBinaryEdit.h"
#include "system/property_list/PropertyListBinaryReader.h"
#include "system/property_list/PropertyListCodec.h"
#include "system/property_list/PropertyListPlainXmlReader.h"
#include "system/property_list/PropertyListXmlReader.h"

namespace appsync {

namespace {

constexpr std::uint64_t kMostUnpacked = std::uint64_t{1} << 20U;
constexpr std::uint64_t kMostEntries = 100;

/// The value with its dates rounded down to the second, as XML has them.
PropertyList inWholeSeconds(const PropertyList& value) {
    if (const auto date = value.asDate()) {
        return PropertyList::Date{std::floor(date->secondsSince2001)};
    }
    if (value.isArray()) {
        PropertyList array = PropertyList::array();
        for (const PropertyList& element : value.elements()) array.append(inWholeSeconds(element));
        return array;
    }
    if (!value.isMap()) return value;
    PropertyList map = PropertyList::map();
    for (const auto& [key, inner] : value.entries()) map.set(key, inWholeSeconds(inner));
    return map;
}

/// In binary always; in XML when XML can carry it.
bool isReadBackEqual(const PropertyList& value) {
    SystemPropertyLists codec;
    const auto binary = codec.serialize(value, PropertyListFormat::Binary);
    if (!binary) return false;
    const auto fromBinary = codec.parse(*binary);
    if (!fromBinary || *fromBinary != value) return false;
    const auto xml = codec.serialize(value, PropertyListFormat::Xml);
    if (!xml) return true;
    const auto fromXml = codec.parse(*xml);
    return fromXml.ok() && *fromXml == inWholeSeconds(value);
}

Reading readList(const Result<PropertyList>& value, std::string_view placeKey) {
    if (value) {
        return Reading::read().unless(isReadBackEqual(*value), "it does not read back equal");
    }
    return Reading::refused(value.error().description())
        .unless(value.error().userInfo.find(placeKey) != nullptr, "the refusal names no place");
}

Reading unpackAndLook(PackageReader& package) {
    const PackageInfo& info = package.info();
    const ScratchDirectory target;
    const Status unpacked = package.unpackInto(target.open().get());
    if (!unpacked) return Reading::refused(unpacked.error().description());
    std::uint64_t bytes = 0;
    const std::string danger = target.findDanger(bytes);
    const auto infoFile =
        std::filesystem::path(target.path()) / info.bundleDirectoryName / "Info.plist";
    return Reading::read()
        .unless(danger.empty(), danger)
        .unless(bytes == info.unpackedBytes, "it is not of the size that was announced")
        .unless(std::filesystem::is_regular_file(infoFile), "it has no Info.plist");
}

std::string_view nextLine(std::string_view& text) {
    const std::size_t end = std::min(text.find('\n'), text.size());
    const std::string_view line = text.substr(0, end);
    text.remove_prefix(std::min(end + 1, text.size()));
    return line;
}

}  // namespace

Reading readXmlList(ByteView bytes) {
    const auto value = readXmlPropertyList(bytes);
    const auto plain = readPlainXmlPropertyList(bytes);
    return readList(value, "line")
        .unless(!plain || (value.ok() && *value == *plain), "the plain form reads otherwise");
}

Reading readBinaryList(ByteView bytes) {
    // Of bytes that nobody has looked at yet, it must only come back, and leave their size alone.
    Bytes changed(bytes.begin(), bytes.end());
    const bool replaced = replaceBinaryText(changed, 0, "operation", "SENT");
    return readList(readBinaryPropertyList(bytes), "offset")
        .unless(changed.size() == bytes.size(), "a replaced text moves others")
        .unless(replaced || std::equal(changed.begin(), changed.end(), bytes.begin()),
                "what could not be replaced has changed");
}

Reading readPackage(ByteView bytes) {
    SystemPropertyLists propertyLists;
    auto package = PackageReader::open(fileOf(bytes).get(), "foreign.zip", propertyLists);
    if (!package) return Reading::refused(package.error().description());
    const PackageInfo& info = package->info();
    static_cast<void>(package->readStoreMetadata());
    static_cast<void>(package->readBundleFile(info.iconFile, kMostUnpacked));
    const bool isSmall = info.unpackedBytes <= kMostUnpacked && info.entryCount <= kMostEntries;
    return (isSmall ? unpackAndLook(*package) : Reading::read())
        .unless(isLegalIdentifier(info.identifier), "its identifier is not legal");
}

Reading readDataArchive(ByteView bytes) {
    const ScratchDirectory target;
    const Status unpacked =
        unpackDataArchive(fileOf(bytes).get(), "foreign.zip", target.open().get());
    std::uint64_t unpackedBytes = 0;
    const std::string danger = target.findDanger(unpackedBytes);
    return (unpacked ? Reading::read() : Reading::refused(unpacked.error().description()))
        .unless(danger.empty(), danger);
}

Reading readIcon(ByteView bytes) {
    const Result<Bytes> icon = renderIcon(bytes);
    if (!icon) return Reading::refused(icon.error().description());
    return Reading::read().unless(!icon->empty(), "it became no picture");
}

Reading readManifest(ByteView bytes) {
    const Result<BackupManifest> manifest = parseBackupManifest(bytes, "foreign.json");
    if (!manifest) {
        return Reading::refused(manifest.error().description())
            .unless(manifest.error().description().find("foreign.json") != std::string::npos,
                    "the refusal does not name the file");
    }
    const auto isLegal = [](const BackedUpApplication& each) {
        return isLegalIdentifier(each.identifier);
    };
    const auto isInside = [](const auto& file) {
        constexpr std::string_view kFolder = "data/";
        std::string_view name = file.first;
        if (name.starts_with(kFolder)) name.remove_prefix(kFolder.size());
        return !name.empty() && name != "." && name != ".." &&
               name.find('/') == std::string_view::npos;
    };
    return Reading::read()
        .unless(std::ranges::all_of(manifest->applications, isLegal), "an illegal identifier")
        .unless(std::ranges::all_of(manifest->files, isInside), "a file outside the backup");
}

Reading readSessionRecording(ByteView bytes) {
    const Result<RecordedSession> session =
        readRecording({reinterpret_cast<const char*>(bytes.data()), bytes.size()});
    if (!session) {
        const std::string why = session.error().description();
        return Reading::refused(why).unless(why.find("recording") != std::string::npos,
                                            "the refusal does not say of what");
    }
    const auto isPlaced = [&session](const RecordStretch& stretch) {
        return std::ranges::all_of(stretch.lines, [&](std::size_t line) {
            return line > stretch.beginning && line < session->lines.size();
        });
    };
    const auto isShown = [](const RecordLine& line) {
        static_cast<void>(mentions(line, "a"));
        return !recordText(line).empty();
    };
    return Reading::read()
        .unless(std::ranges::all_of(session->stretches, isPlaced), "a line before its beginning")
        .unless(std::ranges::all_of(session->lines, isShown), "a line that shows nothing");
}

Reading readLibraryIndex(ByteView bytes) {
    constexpr std::size_t kSumLength = 64;
    constexpr std::size_t kNoFolderLength = 8;
    RunningSum sum;
    sum.add(bytes);
    Bytes index = indexBytes({});
    index.resize(index.size() - kNoFolderLength - kSumLength);
    for (const char digit : sum.finish()) index.push_back(static_cast<std::uint8_t>(digit));
    index.insert(index.end(), bytes.begin(), bytes.end());
    const auto contents = readIndex(index);
    if (!contents) return Reading::refused("it is no index");
    const auto isLegal = [](const IndexedPackage& each) {
        return isLegalIdentifier(each.package.identifier);
    };
    return Reading::read()
        .unless(std::ranges::all_of(contents->packages, isLegal), "an illegal identifier")
        .unless(indexBytes(*contents) == index, "it is written otherwise");
}

Reading readJsonList(ByteView bytes) {
    const std::string_view text(reinterpret_cast<const char*>(bytes.data()), bytes.size());
    const Result<PropertyList> value = propertyListOfJson(text);
    if (!value) return Reading::refused(value.error().description());
    const Result<PropertyList> again = propertyListOfJson(jsonText(*value));
    return Reading::read().unless(again.ok() && *again == *value, "it does not read back equal");
}

Reading readVersions(ByteView bytes) {
    std::string_view text(reinterpret_cast<const char*>(bytes.data()), bytes.size());
    std::array<std::string_view, 3> versions;
    for (std::string_view& version : versions) version = nextLine(text);
    Reading reading = Reading::read();
    for (const std::string_view a : versions) {
        for (const std::string_view b : versions) {
            const std::weak_ordering there = compareVersions(a, b);
            reading = std::move(reading).unless(there == 0 <=> compareVersions(b, a),
                                                "turned round it is another order");
            for (const std::string_view c : versions) {
                if (there > 0 || compareVersions(b, c) > 0) continue;
                reading = std::move(reading).unless(compareVersions(a, c) <= 0,
                                                    "the order goes round in a circle");
            }
        }
    }
    return reading;
}

}  // namespace appsync
