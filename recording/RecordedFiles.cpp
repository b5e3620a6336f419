#include "recording/RecordedFiles.h"

#include "recording/Recording.h"

namespace appsync {

bool RecordedFiles::itemExists(const std::string& path) {
    return CallRecord(recording_, "FileSystem.itemExists", 0, path).answer(inner_.itemExists(path));
}

Result<ItemAttributes> RecordedFiles::attributes(const std::string& path) {
    return CallRecord(recording_, "FileSystem.attributes", 0, path).answer(inner_.attributes(path));
}

Status RecordedFiles::createDirectory(const std::string& path, bool withIntermediates,
                                      const FileAttributes* attributes) {
    return CallRecord(recording_, "FileSystem.createDirectory", 0, path, withIntermediates,
                      attributes)
        .answer(inner_.createDirectory(path, withIntermediates, attributes));
}

Status RecordedFiles::removeItem(const std::string& path) {
    return CallRecord(recording_, "FileSystem.removeItem", 0, path).answer(inner_.removeItem(path));
}

Status RecordedFiles::moveItem(const std::string& from, const std::string& to) {
    return CallRecord(recording_, "FileSystem.moveItem", 0, from, to)
        .answer(inner_.moveItem(from, to));
}

Status RecordedFiles::copyItem(const std::string& from, const std::string& to) {
    return CallRecord(recording_, "FileSystem.copyItem", 0, from, to)
        .answer(inner_.copyItem(from, to));
}

Result<Bytes> RecordedFiles::readFile(const std::string& path) {
    return CallRecord(recording_, "FileSystem.readFile", 0, path).answer(inner_.readFile(path));
}

Status RecordedFiles::writeFileAtomically(const std::string& path, ByteView contents) {
    return CallRecord(recording_, "FileSystem.writeFileAtomically", 0, path, contents)
        .answer(inner_.writeFileAtomically(path, contents));
}

Status RecordedFiles::createFile(const std::string& path, ByteView contents,
                                 const FileAttributes& attributes) {
    return CallRecord(recording_, "FileSystem.createFile", 0, path, contents, attributes)
        .answer(inner_.createFile(path, contents, attributes));
}

Status RecordedFiles::setTimesToNow(const std::string& path) {
    return CallRecord(recording_, "FileSystem.setTimesToNow", 0, path)
        .answer(inner_.setTimesToNow(path));
}

std::string RecordedFiles::temporaryDirectory() {
    return CallRecord(recording_, "FileSystem.temporaryDirectory", 0)
        .answer(inner_.temporaryDirectory());
}

Result<PropertyList> RecordedPropertyLists::parse(ByteView bytes) {
    CallRecord record(recording_, "PropertyListSerialization.parse", 0, bytes.size());
    Result<PropertyList> list = inner_.parse(bytes);
    static_cast<void>(record.answer(list ? Status() : Status(list.error())));
    return list;
}

Result<Bytes> RecordedPropertyLists::serialize(const PropertyList& value,
                                               PropertyListFormat format) {
    CallRecord record(recording_, "PropertyListSerialization.serialize", 0, format);
    Result<Bytes> bytes = inner_.serialize(value, format);
    static_cast<void>(record.answer(bytes ? Status() : Status(bytes.error())));
    return bytes;
}

bool RecordedPropertyLists::replaceText(Bytes& bytes, std::size_t index, std::string_view key,
                                        std::string_view text) {
    return CallRecord(recording_, "PropertyListSerialization.replaceText", 0, bytes.size(), index,
                      key, text)
        .answer(inner_.replaceText(bytes, index, key, text));
}

}  // namespace appsync
