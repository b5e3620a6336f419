#include "device/install/PlaceholderInstall.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <cerrno>

#include "device/database/CoordinationTables.h"
#include "device/database/Database.h"
#include "device/database/DeviceDatabase.h"
#include "device/database/RegistryTables.h"
#include "device/install/Containers.h"
#include "device/install/DurabilityBarrier.h"
#include "device/install/InstallContext.h"
#include "device/install/KeptBundles.h"
#include "device/install/ProgressBook.h"
#include "device/install/UpdateUnderWay.h"
#include "device/screen/IconDrawing.h"
#include "device/values/DeviceError.h"
#include "device/values/PackageText.h"
#include "platform/AppRegistry.h"
#include "platform/PropertyListSerialization.h"
#include "system/file/DescriptorIO.h"
#include "system/file/MachinePath.h"
#include "system/file/PosixError.h"
#include "system/file/RootDirectory.h"
#include "system/file/RootedFileSystem.h"

namespace appsync {

namespace {

constexpr std::uint64_t kLargestInfo = std::uint64_t{1} << 20U;
constexpr std::string_view kInfoName = "Info.plist";
constexpr std::string_view kMetadataName = "VessikMetadata.plist";
constexpr std::string_view kDefaultIconName = "Icon.png";
constexpr std::string_view kBundleSuffix = ".app";

/// A placeholder bundle as it was read.
struct Bundle {
    std::string directoryName;
    std::optional<std::string> version;
    std::optional<std::string> name;
    std::string iconName;
    Bytes info;
    Bytes icon;  // empty when there is none that can be used
};

Status refused(const std::string& identifier, std::string_view reason) {
    return registryError(
        RegistryErrorCode::PlaceholderRefused,
        "the placeholder of " + identifier + " is refused: " + std::string(reason));
}

Result<Bytes> readLimited(const InstallContext& context, const std::string& path,
                          std::uint64_t limit) {
    const Result<RegularFile> file = context.files.root().openRegularFile(path);
    if (!file) return file.error();
    Bytes contents;
    const int error = readWhole(file->descriptor.get(), file->size, limit, contents);
    if (error != 0) return posixError(error, "read", path);
    return contents;
}

std::string lastComponent(std::string_view path) {
    while (path.size() > 1 && path.ends_with('/')) path.remove_suffix(1);
    return std::string(path.substr(path.rfind('/') + 1));
}

// Alone in its container, so a name that had to be cut is as good.
std::string nameOnMachine(std::string name) {
    if (name.size() <= kLongestMachineName) return name;
    name.resize(kLongestMachineName - kBundleSuffix.size());
    return name.append(kBundleSuffix);
}

bool isPlainName(std::string_view name) {
    return !name.empty() && name.size() <= kLongestMachineName && name != "." && name != ".." &&
           name != kInfoName && name.find_first_of(std::string_view("/\0", 2)) == name.npos;
}

std::optional<std::string> textAt(const PropertyList& info, std::string_view key) {
    const std::string* text = info.findString(key);
    if (text == nullptr || text->empty()) return std::nullopt;
    return *text;
}

Status readInfo(const InstallContext& context, const PlaceholderSource& source, Bundle& bundle) {
    const std::string path = source.bundle + "/" + std::string(kInfoName);
    Result<Bytes> bytes = readLimited(context, path, kLargestInfo);
    if (!bytes) return refused(source.identifier, bytes.error().description());
    const Result<PropertyList> info = context.propertyLists.parse(*bytes);
    if (!info) return refused(source.identifier, info.error().withContext(path).description());
    const std::string* identifier = info->findString(BundleIdentifierKey);
    if (identifier == nullptr || *identifier != source.identifier) {
        const std::string found = identifier == nullptr ? "none" : quotedName(*identifier);
        return refused(source.identifier, "the identifier in its Info.plist is " + found);
    }
    bundle.version = textAt(*info, BundleVersionKey);
    bundle.name = textAt(*info, BundleDisplayNameKey);
    bundle.iconName = textAt(*info, BundleIconFileKey).value_or(std::string(kDefaultIconName));
    if (!isPlainName(bundle.iconName)) bundle.iconName = kDefaultIconName;
    bundle.info = std::move(*bytes);
    return {};
}

// A placeholder without its icon is still one.
Result<Bundle> readBundle(const InstallContext& context, const PlaceholderSource& source) {
    Bundle bundle;
    if (Status status = readInfo(context, source, bundle); !status) return status.error();
    bundle.directoryName = nameOnMachine(lastComponent(source.bundle));
    if (!isPlainName(bundle.directoryName)) {
        return refused(source.identifier, "its directory has no name").error();
    }
    Result<Bytes> icon =
        readLimited(context, source.bundle + "/" + bundle.iconName, kMaximumIconFileBytes);
    if (icon) bundle.icon = std::move(*icon);
    return bundle;
}

Status writeNewFile(int directory, std::string_view name, ByteView contents) {
    const std::string path(name);
    const int flags = O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC | O_NOFOLLOW;
    const UniqueFd file(::openat(directory, path.c_str(), flags, 0644));
    if (!file) return posixError(errno, "create", path);
    const WriteOutcome outcome = writeWhole(file.get(), contents);
    if (outcome.error != 0) return posixError(outcome.error, "write", path);
    return {};
}

Status writeBundle(int container, const Bundle& bundle) {
    const char* name = bundle.directoryName.c_str();
    if (::mkdirat(container, name, 0755) != 0) return posixError(errno, "create", name);
    const UniqueFd directory(::openat(container, name, O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    if (!directory) return posixError(errno, "open", name);
    if (Status status = writeNewFile(directory.get(), kInfoName, bundle.info); !status) {
        return status;
    }
    if (bundle.icon.empty()) return {};
    return writeNewFile(directory.get(), bundle.iconName, bundle.icon);
}

Result<NewContainer> writeContainer(const InstallContext& context, const Bundle& bundle,
                                    const PlaceholderSource& source) {
    Result<NewContainer> container = context.containers.make();
    if (!container) return container;
    Status status = writeBundle(container->descriptor(), bundle);
    if (status && source.storeMetadata) {
        status = writeNewFile(container->descriptor(), kMetadataName, *source.storeMetadata);
    }
    if (!status) return status.error();
    return container;
}

BundleRow rowOf(const Bundle& bundle, const PlaceholderSource& source,
                const NewContainer& container) {
    BundleRow row;
    row.identifier = source.identifier;
    row.version = bundle.version;
    row.name = bundle.name;
    row.installType = source.installType;
    row.container = container.name();
    row.bundle = bundle.directoryName;
    row.iconFile = bundle.iconName;
    row.bytes = bundle.info.size() + bundle.icon.size();
    if (source.storeMetadata) row.bytes += source.storeMetadata->size();
    return row;
}

Status beginProgress(Database& database, const BundleRow& row) {
    Query remove = database.query("DELETE FROM progress WHERE identifier = ?");
    if (Status status = remove.bind(row.identifier).run(); !status) return status;
    if (isDemotedType(row.installType)) return {};
    return database
        .query(
            "INSERT INTO progress (identifier, state, phase, total, completed)"
            " VALUES (?, ?, ?, ?, 0)")
        .bind(row.identifier, static_cast<std::uint64_t>(kInstallStateWaiting),
              static_cast<std::uint64_t>(kInstallPhaseLoading), kProgressUnits)
        .run();
}

bool isNew(const InstallContext& context, const PlaceholderSource& source) {
    bool isNew = false;
    const Status status = context.database.read([&](Database& database) -> Status {
        const auto row = findBundle(database, BundleTable::Placeholders, source.identifier);
        if (!row) return row.error();
        isNew = !row->has_value();
        return {};
    });
    return status && isNew;
}

// Whether a loss of power may take a new placeholder with it.
bool mayBeLost(const InstallContext& context, const PlaceholderSource& source) {
    return source.installType == kInstallTypeSync && !context.boot.empty();
}

Status commitPlaceholder(const InstallContext& context, const BundleRow& row,
                         const PlaceholderExtras& extras, NewContainer& container,
                         const AlsoCommitted& alsoCommitted) {
    FreedContainers freed;
    context.progress.forget(row.identifier);
    const Durability durability = extras.unsyncedBoot ? Durability::Soon : Durability::OnDisk;
    const Status committed = context.database.change(durability, [&](Database& database) {
        Status status = recordPlaceholder(database, row, extras, freed);
        if (status) status = beginProgress(database, row);
        return status && alsoCommitted ? alsoCommitted(database) : status;
    });
    if (!committed) return asRegistryStatus(committed);
    container.keep();
    context.progress.forget(row.identifier);
    context.containers.remove(freed.placeholder);
    return {};
}

Status installBundle(const InstallContext& context, const Bundle& bundle,
                     const PlaceholderSource& source, bool isNew,
                     const AlsoCommitted& alsoCommitted) {
    Result<NewContainer> container = writeContainer(context, bundle, source);
    if (!container) return container.error();
    PlaceholderExtras extras{source.sinf, std::nullopt};
    if (isNew && mayBeLost(context, source)) {
        extras.unsyncedBoot = context.boot;
    } else if (Status status = context.barrier.pass(); !status) {
        return status;
    }
    return commitPlaceholder(context, rowOf(bundle, source, *container), extras, *container,
                             alsoCommitted);
}

Status install(const InstallContext& context, const PlaceholderSource& source) {
    const Result<Bundle> bundle = readBundle(context, source);
    if (!bundle) return bundle.error();
    return installBundle(context, *bundle, source, isNew(context, source), {});
}

Result<Bundle> makeBundle(const InstallContext& context, const PlaceholderContents& contents) {
    Result<Bytes> info = context.propertyLists.serialize(contents.info, PropertyListFormat::Binary);
    if (!info) return refused(contents.identifier, info.error().description()).error();
    Bundle bundle;
    bundle.directoryName = nameOnMachine(contents.identifier + std::string(kBundleSuffix));
    bundle.version = textAt(contents.info, BundleVersionKey);
    bundle.name = textAt(contents.info, BundleDisplayNameKey);
    bundle.iconName = kDefaultIconName;
    bundle.info = std::move(*info);
    if (!contents.iconFile) return bundle;
    Result<Bytes> icon = readLimited(context, *contents.iconFile, kMaximumIconFileBytes);
    if (icon) bundle.icon = std::move(*icon);
    return bundle;
}

ErrorRecord notInstalled(const std::string& identifier, const std::optional<BundleRow>& covering) {
    std::string why = " is not installed; appsync apps shows what is";
    if (covering) {
        why =
            isDemotedType(covering->installType)
                ? " is offloaded already; there is nothing more to do"
                : " is a placeholder, whose package is still to come; offload it once it is there";
    }
    return registryError(RegistryErrorCode::NothingInstalled, identifier + why);
}

Status requireNotRunning(Database& database, const std::string& identifier) {
    Query rows = database.query("SELECT 1 FROM running WHERE identifier = ?");
    rows.bind(identifier);
    if (!rows.next()) return rows.status();
    return registryError(RegistryErrorCode::Running,
                         identifier + " is running; quit it (appsync quit DEVICE " + identifier +
                             "), and offload it then");
}

Result<BundleRow> findDemotable(const InstallContext& context, const std::string& identifier) {
    std::optional<BundleRow> application;
    std::optional<BundleRow> covering;
    std::optional<StoredCoordinator> coordinator;
    const Status status = context.database.read([&](Database& database) -> Status {
        auto placeholder = findBundle(database, BundleTable::Placeholders, identifier);
        if (!placeholder) return placeholder.error();
        covering = std::move(*placeholder);
        auto row = findBundle(database, BundleTable::Applications, identifier);
        if (!row) return row.error();
        application = std::move(*row);
        auto found = findCoordinator(database, identifier);
        if (!found) return found.error();
        coordinator = std::move(*found);
        return requireNotRunning(database, identifier);
    });
    if (!status) return asRegistryStatus(status).error();
    if (!application) return notInstalled(identifier, covering);
    if (!covering && !coordinator) return *std::move(application);
    return updateIsUnderWay(identifier, coordinator, "offload it");
}

PlaceholderSource sourceOf(const InstallContext& context, const BundleRow& application,
                           std::uint64_t installType) {
    const AppProxy proxy = proxyOf(application, BundleTable::Applications);
    PlaceholderSource source;
    source.identifier = application.identifier;
    source.bundle = proxy.bundlePath;
    source.installType = installType;
    const std::string metadata = proxy.bundleContainerPath + "/" + std::string(kMetadataName);
    Result<Bytes> bytes = readLimited(context, metadata, kLargestInfo);
    if (bytes) source.storeMetadata = std::move(*bytes);
    return source;
}

}  // namespace

Status installPlaceholder(const InstallContext& context, const PlaceholderSource& source) {
    Status status = install(context, source);
    if (!status) rememberFailure(context, source.identifier, status.error());
    return status;
}

Status installPlaceholderWith(const InstallContext& context, const PlaceholderContents& contents,
                              const std::function<Status(Database&)>& alsoCommitted) {
    const Result<Bundle> bundle = makeBundle(context, contents);
    if (!bundle) return bundle.error();
    PlaceholderSource source;
    source.identifier = contents.identifier;
    source.installType = contents.installType;
    source.storeMetadata = contents.storeMetadata;
    source.sinf = contents.sinf;
    return installBundle(context, *bundle, source, contents.isNew, alsoCommitted);
}

bool isDemotedType(std::uint64_t installType) noexcept {
    return installType == kInstallTypeDowngrade || installType == kInstallTypeIntentionalDowngrade;
}

Status demoteApplication(const InstallContext& context, const std::string& identifier,
                         std::uint64_t installType) {
    const Result<BundleRow> application = findDemotable(context, identifier);
    if (!application) return application.error();
    const PlaceholderSource source = sourceOf(context, *application, installType);
    const Result<Bundle> bundle = readBundle(context, source);
    if (!bundle) return bundle.error();
    Result<NewContainer> container = writeContainer(context, *bundle, source);
    if (!container) return container.error();
    if (Status status = context.barrier.pass(); !status) return status;
    const BundleRow row = rowOf(*bundle, source, *container);
    FreedContainers freed;
    const Status committed = context.database.change(Durability::OnDisk, [&](Database& database) {
        Status status = requireNotRunning(database, identifier);  // somebody may have started it
        if (status) status = recordPlaceholder(database, row, {}, freed);
        if (!status) return status;
        return forgetApplication(database, identifier, freed);
    });
    if (!committed) return asRegistryStatus(committed);
    container->keep();
    putAway(context, freed);
    return {};
}

}  // namespace appsync
