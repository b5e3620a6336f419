#include "simulation/files/SimulatedFileSystem.h"

#include <algorithm>
#include <cerrno>
#include <functional>
#include <system_error>

#include "simulation/recording/RecordedCall.h"

namespace appsync {
namespace {

constexpr std::string_view kTemporaryDirectory = "/tmp";

bool isTemporary(std::string_view path) {
    return path.starts_with(kTemporaryDirectory) &&
           path.substr(kTemporaryDirectory.size()).starts_with('/');
}

constexpr std::string_view kFileSystem = "FileSystem";
constexpr std::string_view kDefaultAccount = "mobile";
constexpr std::size_t kLongestPath = 4095;
constexpr std::size_t kLongestName = 255;
constexpr int kMostLinks = 40;

Status statusOf(int error, std::string_view operation, const std::string& path) {
    if (error == 0) return {};
    const std::string reason = std::generic_category().message(error);
    return ErrorRecord::make(kPosixErrorDomain, error,
                             "cannot " + std::string(operation) + " '" + path + "': " + reason);
}

std::vector<std::string> componentsOf(std::string_view path) {
    std::vector<std::string> components;
    while (!path.empty()) {
        const std::size_t length = std::min(path.find('/'), path.size());
        const std::string_view component = path.substr(0, length);
        if (!component.empty() && component != ".") components.emplace_back(component);
        path.remove_prefix(std::min(length + 1, path.size()));
    }
    return components;
}

/// The one copy of a name, which outlives every file system.
const std::string* accountName(std::string_view name) {
    static auto& names = *new std::set<std::string, std::less<>>;
    const auto found = names.find(name);
    return found != names.end() ? &*found : &*names.emplace(name).first;
}

int checkPath(const std::string& path) {
    if (!path.starts_with('/') || path.find('\0') != std::string::npos) return EINVAL;
    if (path.size() > kLongestPath) return ENAMETOOLONG;
    return 0;
}

}  // namespace

/// The directory that holds an item, and the item, if there is one.
struct SimulatedFileSystem::Place {
    NodePointer directory;
    std::string name;
    NodePointer node;
};

SimulatedFileSystem::Contents SimulatedFileSystem::share(ByteView contents) {
    return std::make_shared<const Bytes>(contents.begin(), contents.end());
}

SimulatedFileSystem::SimulatedFileSystem(Recorder& recorder) : recorder_(recorder) {
    root_ = makeNode();
    root_->kind = Node::Kind::Directory;
    for (const char* path :
         {"/tmp", "/var/mobile/Library/Preferences", "/var/mobile/Media/PublicStaging"}) {
        addDirectory(path);
    }
}

SimulatedFileSystem::~SimulatedFileSystem() = default;

bool SimulatedFileSystem::itemExists(const std::string& path) {
    RecordedCall call(recorder_, kFileSystem, "itemExists", path);
    return call.result(exists(path));
}

Result<ItemAttributes> SimulatedFileSystem::attributes(const std::string& path) {
    RecordedCall call(recorder_, kFileSystem, "attributes", path);
    NodePointer node;
    int error = fault(FileOperation::Attributes, path);
    if (error == 0) error = resolve(path, node);
    if (error != 0) {
        return call.result(Result<ItemAttributes>(statusOf(error, "examine", path).error()));
    }
    const bool isDirectory = node->kind == Node::Kind::Directory;
    return call.result(Result<ItemAttributes>(ItemAttributes{node->contents->size(), isDirectory}));
}

Status SimulatedFileSystem::createDirectory(const std::string& path, bool withIntermediates,
                                            const FileAttributes* attributes) {
    const FileAttributes wanted = attributes != nullptr ? *attributes : FileAttributes{};
    RecordedCall call(recorder_, kFileSystem, "createDirectory", path,
                      withIntermediates ? "with intermediates" : "alone",
                      attributes != nullptr ? callText(wanted) : "(null)");
    int error = fault(FileOperation::CreateDirectory, path);
    if (error == 0) error = checkAttributes(wanted);
    if (error == 0) {
        error = withIntermediates ? makeDirectories(path, wanted) : makeDirectory(path, wanted);
    }
    tell(error, "createDirectory", path);
    return call.result(statusOf(error, "create the directory", path));
}

Status SimulatedFileSystem::removeItem(const std::string& path) {
    RecordedCall call(recorder_, kFileSystem, "removeItem", path);
    int error = fault(FileOperation::RemoveItem, path);
    if (error == 0) error = removeAt(path);
    tell(error, "removeItem", path);
    return call.result(statusOf(error, "remove", path));
}

Status SimulatedFileSystem::moveItem(const std::string& from, const std::string& to) {
    RecordedCall call(recorder_, kFileSystem, "moveItem", from, to);
    int error = fault(FileOperation::MoveItem, from);
    if (error == 0) error = moveTo(from, to);
    tell(error, "moveItem", from + ", " + to);
    return call.result(statusOf(error, "move", from + "' to '" + to));
}

Status SimulatedFileSystem::copyItem(const std::string& from, const std::string& to) {
    RecordedCall call(recorder_, kFileSystem, "copyItem", from, to);
    int error = fault(FileOperation::CopyItem, from);
    if (error == 0) error = copyTo(from, to);
    tell(error, "copyItem", from + ", " + to);
    return call.result(statusOf(error, "copy", from + "' to '" + to));
}

Result<Bytes> SimulatedFileSystem::readFile(const std::string& path) {
    RecordedCall call(recorder_, kFileSystem, "readFile", path);
    NodePointer node;
    int error = fault(FileOperation::ReadFile, path);
    if (error == 0) error = regularFileAt(path, node);
    if (error != 0) return call.result(Result<Bytes>(statusOf(error, "read", path).error()));
    return call.result(Result<Bytes>(*node->contents));
}

Status SimulatedFileSystem::writeFileAtomically(const std::string& path, ByteView contents) {
    RecordedCall call(recorder_, kFileSystem, "writeFileAtomically", path, contents);
    int error = fault(FileOperation::WriteFileAtomically, path);
    const Written written = isTemporary(path) ? Written::Unsynced : Written::Synced;
    if (error == 0) error = replaceFile(path, share(contents), {}, written);
    tell(error, "writeFileAtomically", path);
    return call.result(statusOf(error, "write", path));
}

Status SimulatedFileSystem::createFile(const std::string& path, ByteView contents,
                                       const FileAttributes& attributes) {
    RecordedCall call(recorder_, kFileSystem, "createFile", path, contents, attributes);
    int error = fault(FileOperation::CreateFile, path);
    if (error == 0) error = checkAttributes(attributes);
    if (error == 0) error = replaceFile(path, share(contents), attributes, Written::Unsynced);
    tell(error, "createFile", path);
    return call.result(statusOf(error, "create", path));
}

Status SimulatedFileSystem::setTimesToNow(const std::string& path) {
    RecordedCall call(recorder_, kFileSystem, "setTimesToNow", path);
    NodePointer node;
    int error = fault(FileOperation::SetTimesToNow, path);
    if (error == 0) error = resolve(path, node);
    if (error == 0) node->modified = recorder_.scheduler().now();
    tell(error, "setTimesToNow", path);
    return call.result(statusOf(error, "set the times of", path));
}

std::string SimulatedFileSystem::temporaryDirectory() {
    RecordedCall call(recorder_, kFileSystem, "temporaryDirectory");
    return call.result(std::string(kTemporaryDirectory));
}

// Resolution. Each gives an errno value, or 0.

/// The item at a path that names directories all the way, without links or ".."; null for any
/// other.
const SimulatedFileSystem::NodePointer* SimulatedFileSystem::plainlyAt(
    std::string_view path) const {
    const NodePointer* here = &root_;
    while (!path.empty()) {
        const std::size_t length = std::min(path.find('/'), path.size());
        const std::string_view name = path.substr(0, length);
        path.remove_prefix(std::min(length + 1, path.size()));
        if (name.empty()) continue;
        const auto child = (*here)->children.find(name);
        if (child == (*here)->children.end()) return nullptr;
        if (child->second->kind != Node::Kind::Directory && !path.empty()) return nullptr;
        here = &child->second;
    }
    return (*here)->kind == Node::Kind::Link ? nullptr : here;
}

int SimulatedFileSystem::resolve(const std::string& path, NodePointer& found) const {
    if (const int error = checkPath(path); error != 0) return error;
    if (const NodePointer* node = path.ends_with('/') ? nullptr : plainlyAt(path)) {
        found = *node;
        return 0;
    }
    return resolveByStep(path, found);
}

int SimulatedFileSystem::resolveByStep(const std::string& path, NodePointer& found) const {
    std::vector<std::string> pending = componentsOf(path);
    std::reverse(pending.begin(), pending.end());
    std::vector<NodePointer> way{root_};
    int links = 0;
    while (!pending.empty()) {
        const std::string name = std::move(pending.back());
        pending.pop_back();
        if (way.back()->kind != Node::Kind::Directory) return ENOTDIR;
        if (name == "..") {
            if (way.size() > 1) way.pop_back();
            continue;
        }
        if (name.size() > kLongestName) return ENAMETOOLONG;
        const auto child = way.back()->children.find(name);
        if (child == way.back()->children.end()) return ENOENT;
        if (child->second->kind != Node::Kind::Link) {
            way.push_back(child->second);
            continue;
        }
        if (++links > kMostLinks) return ELOOP;
        const Bytes& bytes = *child->second->contents;
        const std::string target(bytes.begin(), bytes.end());
        if (target.starts_with('/')) way.assign(1, root_);
        const std::vector<std::string> components = componentsOf(target);
        pending.insert(pending.end(), components.rbegin(), components.rend());
    }
    const bool mustBeDirectory = path.ends_with('/') || path.ends_with("/.");
    if (mustBeDirectory && way.back()->kind != Node::Kind::Directory) return ENOTDIR;
    found = way.back();
    return 0;
}

/// The item itself is not followed if it is a link.
int SimulatedFileSystem::place(const std::string& path, Place& found) const {
    if (const int error = checkPath(path); error != 0) return error;
    const std::size_t end = path.find_last_not_of('/');
    if (end == std::string::npos) return EINVAL;
    const std::size_t begin = path.rfind('/', end) + 1;
    found.name = path.substr(begin, end + 1 - begin);
    if (found.name == "." || found.name == "..") return EINVAL;
    if (found.name.size() > kLongestName) return ENAMETOOLONG;
    const std::string parent = path.substr(0, begin > 1 ? begin - 1 : begin);
    if (const int error = resolve(parent, found.directory); error != 0) return error;
    if (found.directory->kind != Node::Kind::Directory) return ENOTDIR;
    const auto child = found.directory->children.find(found.name);
    if (child == found.directory->children.end()) return 0;
    found.node = child->second;
    const bool mustBeDirectory = end + 1 < path.size();
    return mustBeDirectory && found.node->kind != Node::Kind::Directory ? ENOTDIR : 0;
}

SimulatedFileSystem::NodePointer SimulatedFileSystem::nodeAt(const std::string& path) const {
    NodePointer node;
    return resolve(path, node) == 0 ? node : nullptr;
}

int SimulatedFileSystem::regularFileAt(const std::string& path, NodePointer& found) const {
    if (const int error = resolve(path, found); error != 0) return error;
    if (found->kind == Node::Kind::Directory) return EISDIR;
    return found->kind == Node::Kind::File ? 0 : EINVAL;
}

// Changes. Each gives an errno value, or 0, and then nothing was changed.

int SimulatedFileSystem::checkAttributes(const FileAttributes& attributes) const {
    const bool ownerKnown = !attributes.owner || accounts_.count(*attributes.owner) != 0;
    const bool groupKnown = !attributes.group || accounts_.count(*attributes.group) != 0;
    return ownerKnown && groupKnown ? 0 : EINVAL;
}

/// The accounts are known.
void SimulatedFileSystem::give(Node& node, const FileAttributes& attributes) {
    if (attributes.owner) node.owner = accountName(*attributes.owner);
    if (attributes.group) node.group = accountName(*attributes.group);
}

int SimulatedFileSystem::makeDirectory(const std::string& path, const FileAttributes& attributes) {
    Place target;
    if (const int error = place(path, target); error != 0) return error;
    if (target.node != nullptr) return EEXIST;
    NodePointer node = makeNode();
    node->kind = Node::Kind::Directory;
    give(*node, attributes);
    setChild(target.directory, target.name, std::move(node), Written::Nothing);
    return 0;
}

int SimulatedFileSystem::makeDirectories(const std::string& path,
                                         const FileAttributes& attributes) {
    if (const int error = checkPath(path); error != 0) return error;
    if (const NodePointer* node = plainlyAt(path)) {
        if ((*node)->kind == Node::Kind::Directory) return 0;
    }
    std::size_t end = 0;
    while (end != std::string::npos && path.find_first_not_of('/', end) != std::string::npos) {
        end = path.find('/', path.find_first_not_of('/', end));
        const std::string prefix = path.substr(0, end);
        const NodePointer there = nodeAt(prefix);
        if (there != nullptr && there->kind == Node::Kind::Directory) continue;
        if (const int error = makeDirectory(prefix, attributes); error != 0) return error;
    }
    return 0;
}

int SimulatedFileSystem::replaceFile(const std::string& path, Contents contents,
                                     const FileAttributes& attributes, Written written) {
    Place target;
    if (const int error = place(path, target); error != 0) return error;
    if (path.ends_with('/')) return EISDIR;
    const NodePointer& old = target.node;
    if (old != nullptr && old->kind == Node::Kind::Directory) return EISDIR;
    const std::uint64_t without = usedBytes_ - (old != nullptr ? old->bytes() : 0);
    if (contents->size() > capacity_ - std::min(without, capacity_)) return ENOSPC;
    NodePointer node = makeNode();
    if (old != nullptr && old->kind == Node::Kind::File) {
        node->owner = old->owner;
        node->group = old->group;
    }
    give(*node, attributes);
    usedBytes_ = without + contents->size();
    node->contents = std::move(contents);
    setChild(target.directory, target.name, std::move(node), written);
    return 0;
}

int SimulatedFileSystem::moveTo(const std::string& from, const std::string& to) {
    Place source;
    Place target;
    if (const int error = place(from, source); error != 0) return error;
    if (source.node == nullptr) return ENOENT;
    if (const int error = place(to, target); error != 0) return error;
    if (target.node != nullptr) return EEXIST;
    if (source.node->holds(target.directory.get())) return EINVAL;
    if (to.ends_with('/') && source.node->kind != Node::Kind::Directory) return ENOTDIR;
    if (journal_) {
        journal_->record({{source.directory, source.name, source.node, nullptr},
                          {target.directory, target.name, nullptr, source.node}},
                         Written::Nothing);
    }
    source.directory->children.erase(source.name);
    target.directory->children[target.name] = source.node;
    return 0;
}

int SimulatedFileSystem::copyTo(const std::string& from, const std::string& to) {
    NodePointer source;
    Place target;
    if (const int error = regularFileAt(from, source); error != 0) return error;
    if (const int error = place(to, target); error != 0) return error;
    if (target.node != nullptr) return EEXIST;
    return replaceFile(to, source->contents, {}, Written::Unsynced);
}

int SimulatedFileSystem::removeAt(const std::string& path) {
    Place target;
    if (const int error = place(path, target); error != 0) return error;
    if (target.node == nullptr) return ENOENT;
    usedBytes_ -= target.node->bytes();
    recordRemovals(target.node);
    setChild(target.directory, target.name, nullptr, Written::Nothing);
    return 0;
}

/// Null takes away what is there.
void SimulatedFileSystem::setChild(const NodePointer& directory, const std::string& name,
                                   NodePointer node, Written written) {
    const auto found = directory->children.find(name);
    if (journal_) {
        const NodePointer before = found != directory->children.end() ? found->second : nullptr;
        journal_->record({{directory, name, before, node}}, written);
    }
    if (node != nullptr) {
        directory->children[name] = std::move(node);
    } else if (found != directory->children.end()) {
        directory->children.erase(found);
    }
}

/// A directory is removed item by item, what is inside before what holds it.
void SimulatedFileSystem::recordRemovals(const NodePointer& directory) {
    if (!journal_) return;
    for (const auto& [name, child] : directory->children) {
        recordRemovals(child);
        journal_->record({{directory, name, child, nullptr}}, Written::Nothing);
    }
}

void SimulatedFileSystem::tell(int error, std::string_view method, const std::string& arguments) {
    if (error != 0 || !recorder_.isChangeListening()) return;
    recorder_.filesChanged(std::string(kFileSystem) + "." + std::string(method) + "(" + arguments +
                           ")");
}

SimulatedFileSystem::NodePointer SimulatedFileSystem::makeNode() const {
    static const Contents nothing = std::make_shared<const Bytes>();
    auto node = std::make_shared<Node>();
    node->owner = accountName(kDefaultAccount);
    node->group = node->owner;
    node->contents = nothing;
    node->modified = recorder_.scheduler().now();
    return node;
}

// The test's side.

void SimulatedFileSystem::put(const std::string& path, NodePointer node) {
    remove(path);
    const std::size_t end = path.find_last_not_of('/');
    const std::string parent = path.substr(0, path.rfind('/', end));
    Place target;
    int error = makeDirectories(parent.empty() ? "/" : parent, {});
    if (error == 0) error = place(path, target);
    if (error != 0) throw SimulationFailure(statusOf(error, "add", path).error().description());
    usedBytes_ += node->bytes();
    const bool isFile = node->kind == Node::Kind::File;
    setChild(target.directory, target.name, std::move(node),
             isFile ? Written::Unsynced : Written::Nothing);
}

void SimulatedFileSystem::addDirectory(const std::string& path) {
    const int error = makeDirectories(path, {});
    if (error != 0) throw SimulationFailure(statusOf(error, "add", path).error().description());
}

void SimulatedFileSystem::addFile(const std::string& path, ByteView contents) {
    NodePointer node = makeNode();
    node->contents = share(contents);
    put(path, std::move(node));
}

void SimulatedFileSystem::addFile(const std::string& path, std::string_view contents) {
    addFile(path, Bytes(contents.begin(), contents.end()));
}

void SimulatedFileSystem::addLink(const std::string& path, const std::string& target) {
    NodePointer node = makeNode();
    node->kind = Node::Kind::Link;
    node->contents = share(Bytes(target.begin(), target.end()));
    put(path, std::move(node));
}

void SimulatedFileSystem::addPipe(const std::string& path) {
    NodePointer node = makeNode();
    node->kind = Node::Kind::Pipe;
    put(path, std::move(node));
}

void SimulatedFileSystem::remove(const std::string& path) {
    const int error = removeAt(path);
    if (error != 0 && error != ENOENT) {
        throw SimulationFailure(statusOf(error, "remove", path).error().description());
    }
}

bool SimulatedFileSystem::exists(const std::string& path) const { return nodeAt(path) != nullptr; }

std::optional<Bytes> SimulatedFileSystem::contents(const std::string& path) const {
    NodePointer node;
    if (regularFileAt(path, node) != 0) return std::nullopt;
    return *node->contents;
}

std::optional<std::string> SimulatedFileSystem::text(const std::string& path) const {
    const std::optional<Bytes> bytes = contents(path);
    if (!bytes) return std::nullopt;
    return std::string(bytes->begin(), bytes->end());
}

std::optional<std::string> SimulatedFileSystem::ownership(const std::string& path) const {
    const NodePointer node = nodeAt(path);
    if (node == nullptr) return std::nullopt;
    return *node->owner + ":" + *node->group;
}

std::optional<SimulatedTime> SimulatedFileSystem::modificationTime(const std::string& path) const {
    const NodePointer node = nodeAt(path);
    if (node == nullptr) return std::nullopt;
    return node->modified;
}

std::vector<std::string> SimulatedFileSystem::names(const std::string& directory) const {
    std::vector<std::string> result;
    const NodePointer node = nodeAt(directory);
    if (node == nullptr) return result;
    for (const auto& [name, child] : node->children) result.push_back(name);
    return result;
}

std::vector<std::string> SimulatedFileSystem::paths(const std::string& directory) const {
    std::vector<std::string> result;
    const std::string prefix = directory.ends_with('/') ? directory : directory + "/";
    const NodePointer node = nodeAt(directory);
    if (node == nullptr) return result;
    for (const auto& [name, child] : node->children) {
        const bool isDirectory = child->kind == Node::Kind::Directory;
        result.push_back(prefix + name + (isDirectory ? "/" : ""));
        if (!isDirectory) continue;
        for (std::string& below : paths(prefix + name)) result.push_back(std::move(below));
    }
    return result;
}

SimulatedFileSystem::NodePointer SimulatedFileSystem::copyOf(const Node& node) {
    auto copy = std::make_shared<Node>(node);
    for (auto& [name, child] : copy->children) child = copyOf(*child);
    return copy;
}

bool SimulatedFileSystem::copyTree(const std::string& from, const std::string& to) {
    const NodePointer node = nodeAt(from);
    if (node == nullptr || node->kind != Node::Kind::Directory) return false;
    put(to, copyOf(*node));
    return true;
}

// Crashes.

void SimulatedFileSystem::keepJournal() { journal_.emplace(); }

void SimulatedFileSystem::sync() {
    if (journal_) journal_->sync();
}

std::shared_ptr<const FileNode> SimulatedFileSystem::afterCrash(const FileLoss& loss) const {
    if (!journal_) throw SimulationFailure("the file system keeps no journal");
    return journal_->afterCrash(root_, loss);
}

void SimulatedFileSystem::load(const FileNode& root) {
    root_ = copyOf(root);
    usedBytes_ = root_->bytes();
    if (journal_) journal_->sync();
}

// Faults.

void SimulatedFileSystem::failNext(FileOperation operation, std::string_view path, int errnoValue,
                                   std::size_t count) {
    faults_[{operation, std::string(path)}] = Fault{errnoValue, count};
}

void SimulatedFileSystem::failEvery(FileOperation operation, std::string_view path,
                                    int errnoValue) {
    failNext(operation, path, errnoValue, kForEver);
}

int SimulatedFileSystem::fault(FileOperation operation, const std::string& path) {
    auto found = faults_.find({operation, path});
    if (found == faults_.end()) found = faults_.find({operation, std::string(kAnyPath)});
    if (found == faults_.end() || found->second.left == 0) return 0;
    if (found->second.left != kForEver) --found->second.left;
    return found->second.errnoValue;
}

}  // namespace appsync
