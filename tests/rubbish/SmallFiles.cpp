#include "tests/rubbish/SmallFiles.h"

#include <filesystem>
#include <fstream>
#include <initializer_list>
#include <iterator>
#include <string>
#include <string_view>

#include "device/archive/ArchiveWriter.h"
#include "device/archive/PackageFolder.h"
#include "device/package/PackageWriter.h"
#include "device/screen/IconCanvas.h"
#include "fuzz/readers/ScratchDirectory.h"
#include "host/plan/LibraryIndex.h"
#include "system/property_list/PropertyListCodec.h"

namespace appsync {

namespace {

namespace fs = std::filesystem;

constexpr const char* kA = "com.example.a";
constexpr const char* kB = "com.example.b";

Bytes encoded(const PropertyList& value, PropertyListFormat format) {
    return *SystemPropertyLists().serialize(value, format);
}
Bytes xml(const PropertyList& value) { return encoded(value, PropertyListFormat::Xml); }
Bytes binary(const PropertyList& value) { return encoded(value, PropertyListFormat::Binary); }

PropertyList everyKind() {
    return PropertyList::map({{"data", Bytes{1, 2, 250}},
                              {"date", PropertyList::Date{86400}},
                              {"real", -0.5},
                              {"yes", true},
                              {"no", false},
                              {"integers", PropertyList::array({7, -70000, ~std::uint64_t{0}})},
                              {"text", "a & <b> \xc3\xa9 \xf0\x9f\x8d\x8e"},
                              {"again", "text"}});
}

PropertyList todoEntry(const std::string& identifier, std::string_view operation) {
    return PropertyList::map(
        {{"identifier", identifier}, {"operation", operation}, {"version", "1.0"}, {"name", "A"}});
}

void write(const fs::path& path, ByteView bytes) {
    fs::create_directories(path.parent_path());
    std::ofstream file(path, std::ios::binary);
    file.write(reinterpret_cast<const char*>(bytes.data()),
               static_cast<std::streamsize>(bytes.size()));
}

Bytes contentsOf(const fs::path& path) {
    std::ifstream file(path, std::ios::binary);
    return {std::istreambuf_iterator<char>(file), {}};
}

Bytes bytesOf(std::string_view text) { return {text.begin(), text.end()}; }

}  // namespace

Bytes smallXmlList() { return xml(everyKind()); }

Bytes smallBinaryList() { return binary(everyKind()); }

Bytes smallJsonList() {
    constexpr std::string_view kText =
        R"({"text": "x\n\u00e9", "flags": [true, false], "numbers": [-5, 18446744073709551615, 2.5e3],)"
        R"( "data": {"data": "AAH/gA=="}, "date": {"date": "1999-12-31T23:59:58Z"}, "map": {"a": {}}})";
    return {kText.begin(), kText.end()};
}

Bytes smallPackage() {
    const ScratchDirectory scratch;
    const fs::path folder = fs::path(scratch.path()) / "folder";
    write(folder / "A.app" / "Info.plist",
          binary(PropertyList::map({{"BundleIdentifier", kA}, {"BundleVersion", "1.0"}})));
    write(folder / "A.app" / "main", bytesOf("#!"));
    write(folder / "VessikMetadata.plist", bytesOf("<plist><dict/></plist>"));
    const fs::path package = fs::path(scratch.path()) / "a.zip";
    SystemPropertyLists propertyLists;
    if (!writePackage(folder.native(), package.native(), propertyLists)) return {};
    return contentsOf(package);
}

Bytes smallDataArchive() {
    const ScratchDirectory scratch;
    const fs::path top(scratch.path());
    write(top / "letter", bytesOf("Dear"));
    write(top / "zeros", Bytes(300));
    const fs::path archive = top / "data.zip";
    const std::vector<PackageItem> items{
        {top / "Documents", "Documents/", S_IFDIR | 0755U, 0},
        {top / "letter", "Documents/letter", S_IFREG | 0644U, 4, 1},
        {top / "zeros", "zeros", S_IFREG | 0600U, 300}};
    if (!writeArchive(items, archive.native())) return {};
    return contentsOf(archive);
}

Bytes smallIcon() {
    const Result<Surface> surface = makeSurface(3, 2);
    const DrawingContext context = drawOn(surface->get());
    setColor(context.get(), {0.5, 0, 1, 0.5});
    addIconOutline(context.get(), {0, 0, 2});
    return *encodePng(surface->get());
}

Bytes smallManifest() {
    const std::string sum(64, 'a');
    return bytesOf(R"({"format":1,"made":"2026-01-01T00:00:00Z","applications":[{"identifier":")" +
                   std::string(kA) +
                   R"(","version":null,"name":"\u00e9","data":true}],"files":{)"
                   R"("RestoreApplications.plist":{"size":12,"sha256":")" +
                   sum + R"("},"data/com.example.a.zip":{"size":0,"sha256":")" + sum + "\"}}}");
}

Bytes smallRecording() {
    return bytesOf(R"({"recording":1,"plug-in":"1","process":"p","bundle":"b","anonymous":false}
{"t":0,"w":1,"host":"makeClient"}
{"t":1,"w":1,"call":"WorkQueues.runAfter","a":[5,1]}
{"t":2,"w":1,"call":"A.b","on":2,"a":["com.example.a"],"r":{"ok":null},"kept":["c",{"bytes":"/w=="}]}
{"t":3,"w":1,"walk":"A.c","a":[0]}
{"t":3,"w":1,"each":"D","a":[[]]}
{"t":3,"w":1,"end":true,"r":false}
{"t":3,"w":1,"end":true}
{"t":3,"w":1,"end":true}
{"t":4,"w":2,"run":"item","on":1}
{"t":4,"w":2,"end":true}
{"t":5,"w":2,"callback":"A.d","on":3}
{"t":5,"w":2,"end":true}
{"t":6,"w":1,"finished":true}
)");
}

Bytes smallLibraryIndex() {
    constexpr std::size_t kNoFolderLength = 8;
    const IndexedPackage package{{1, 2, 300, 4, 5}, {kA, "1.0", "\u00e9", "a.zip", 300, 4096}};
    const Bytes whole = indexBytes({"/library", {package}});
    const auto head = static_cast<std::ptrdiff_t>(indexBytes({}).size() - kNoFolderLength);
    return {whole.begin() + head, whole.end()};
}

Bytes smallTodoList() {
    return binary(
        PropertyList::array({todoEntry(kA, "install"), todoEntry("com.example.present", "remove"),
                             todoEntry("com.example.other", "install")}));
}

Bytes smallIconOrder() {
    return xml(PropertyList::array({"com.example.c", kA, kB, "com.example.absent"}));
}

Bytes smallRestoreInfo() {
    const Bytes metadata =
        binary(PropertyList::map({{"title", "Shown"}, {"bundleVersion", "1.0"}}));
    return binary(PropertyList::map(
        {{kA, PropertyList::map({{"VessikMetadata", metadata},
                                 {"ApplicationSINF", Bytes{1, 2}},
                                 {"PlaceholderIcon", Bytes{3, 4, 5}}})},
         {"com.example.present", PropertyList::map({{"VessikMetadata", metadata}})}}));
}

Bytes smallDemotedApps() {
    return binary(PropertyList::map({{"AutomaticDowngrades", PropertyList::array({kA, kB})},
                                     {"IntentionalDowngrades", PropertyList::array({kB})}}));
}

Bytes smallRestoreState() {
    const PropertyList path = "/var/mobile/Media/PublicStaging/com.example.a.zip";
    return xml(PropertyList::map(
        {{kA, PropertyList::map({{"1.0", PropertyList::map({{"path", path}})}})}}));
}

Bytes smallStoreMetadata() {
    return binary(PropertyList::map(
        {{"korvuId", "a"},
         {"is-auto-download", true},
         {"com.korvu.VessikStore.downloadInfo",
          PropertyList::map(
              {{"accountInfo",
                PropertyList::map({{"KorvuID", "a"}, {"QPPersonID", 7}, {"AltQPID", "b"}})}})}}));
}

}  // namespace appsync
