#include "device/database/JoinedLog.h"

#include <sqlite3.h>

#include <algorithm>
#include <cstdint>
#include <cstring>
#include <new>
#include <span>
#include <vector>

namespace appsync {

namespace {

constexpr const char* kLayerName = "appsync-joined-log";
// SQLite's own layer writes no more at once.
constexpr std::size_t kMostHeld = 0x1ffff;
// The bytes of a changed page's statement journal that stay in memory; more go to a file.
constexpr int kMostOfStatement = 1 << 20;

// Of the format of the log.
constexpr int kLogLead = 32;
constexpr int kFrameLead = 24;
constexpr int kLockOfWriter = 0;

// How much of an open file is the layer's below.
int sizeBelow = 0;

/// What a log takes before it is in the file.
struct Held {
    std::vector<unsigned char> bytes;
    sqlite3_int64 begin = 0;
    /// Behind all that has come for the log since it began anew. Only what is to stand from there
    /// on is held: a frame that is changed once more is not.
    sqlite3_int64 end = 0;
    bool endsTransaction = false;      // the frame whose lead came last
    sqlite3_file* database = nullptr;  // that the log is of

    [[nodiscard]] sqlite3_int64 heldEnd() const {
        return begin + static_cast<sqlite3_int64>(bytes.size());
    }
};

/// What stands behind the open file of the layer below, whose methods it takes over but for some.
struct Addition {
    sqlite3_io_methods methods;
    const sqlite3_io_methods* below;
    Held* held;  // a log's own; a database's is that of its log
};

Addition& additionOf(sqlite3_file* file) {
    return *reinterpret_cast<Addition*>(reinterpret_cast<unsigned char*>(file) + sizeBelow);
}

int writeHeld(sqlite3_file* file, Addition& addition) {
    Held& held = *addition.held;
    if (held.bytes.empty()) return SQLITE_OK;
    const int result = addition.below->xWrite(file, held.bytes.data(),
                                              static_cast<int>(held.bytes.size()), held.begin);
    held.bytes.clear();
    return result;
}

bool leadEndsTransaction(const void* lead) {
    std::uint32_t pagesAfterwards = 0;
    std::memcpy(&pagesAfterwards, static_cast<const unsigned char*>(lead) + 4,
                sizeof pagesAfterwards);
    return pagesAfterwards != 0;
}

bool hold(Held& held, std::span<const unsigned char> bytes, sqlite3_int64 place) {
    try {
        if (held.bytes.empty()) held.begin = place;
        held.bytes.insert(held.bytes.end(), bytes.begin(), bytes.end());
        return true;
    } catch (const std::bad_alloc&) {
        return false;
    }
}

// What came before is to stand where it belongs first.
int writeFrames(sqlite3_file* file, Addition& addition, std::span<const unsigned char> bytes,
                sqlite3_int64 place) {
    Held& held = *addition.held;
    const bool follows = held.bytes.empty() || place == held.heldEnd();
    if (!follows || held.bytes.size() + bytes.size() > kMostHeld) {
        if (const int result = writeHeld(file, addition); result != SQLITE_OK) return result;
    }
    const bool isAdded = place >= held.end;
    held.end = std::max(held.end, place + static_cast<sqlite3_int64>(bytes.size()));
    if (isAdded && bytes.size() <= kMostHeld && hold(held, bytes, place)) return SQLITE_OK;
    if (const int result = writeHeld(file, addition); result != SQLITE_OK) return result;
    return addition.below->xWrite(file, bytes.data(), static_cast<int>(bytes.size()), place);
}

int writeLog(sqlite3_file* file, const void* data, int size, sqlite3_int64 place) {
    Addition& addition = additionOf(file);
    Held& held = *addition.held;
    if (place < kLogLead) {
        if (const int result = writeHeld(file, addition); result != SQLITE_OK) return result;
        held.end = kLogLead;
        return addition.below->xWrite(file, data, size, place);
    }
    const std::span bytes(static_cast<const unsigned char*>(data), static_cast<std::size_t>(size));
    if (size == kFrameLead) {
        held.endsTransaction = leadEndsTransaction(data);
        return writeFrames(file, addition, bytes, place);
    }
    const int result = writeFrames(file, addition, bytes, place);
    return result == SQLITE_OK && held.endsTransaction ? writeHeld(file, addition) : result;
}

int readLog(sqlite3_file* file, void* data, int size, sqlite3_int64 place) {
    Addition& addition = additionOf(file);
    const int result = writeHeld(file, addition);
    return result == SQLITE_OK ? addition.below->xRead(file, data, size, place) : result;
}

int truncateLog(sqlite3_file* file, sqlite3_int64 size) {
    Addition& addition = additionOf(file);
    const int result = writeHeld(file, addition);
    addition.held->end = 0;
    return result == SQLITE_OK ? addition.below->xTruncate(file, size) : result;
}

int syncLog(sqlite3_file* file, int flags) {
    Addition& addition = additionOf(file);
    const int result = writeHeld(file, addition);
    return result == SQLITE_OK ? addition.below->xSync(file, flags) : result;
}

int sizeOfLog(sqlite3_file* file, sqlite3_int64* size) {
    Addition& addition = additionOf(file);
    const int result = writeHeld(file, addition);
    return result == SQLITE_OK ? addition.below->xFileSize(file, size) : result;
}

// Nobody closes a log in the middle of a transaction that is to be kept.
int closeLog(sqlite3_file* file) {
    Addition& addition = additionOf(file);
    additionOf(addition.held->database).held = nullptr;
    delete addition.held;
    return addition.below->xClose(file);
}

// Who gives up the right to write has committed, or given up what is held.
int lockDatabase(sqlite3_file* file, int offset, int count, int flags) {
    const Addition& addition = additionOf(file);
    constexpr int kGivesBack = SQLITE_SHM_UNLOCK | SQLITE_SHM_EXCLUSIVE;
    if (addition.held != nullptr && flags == kGivesBack && offset == kLockOfWriter) {
        addition.held->bytes.clear();
    }
    return addition.below->xShmLock(file, offset, count, flags);
}

void takeOver(sqlite3_file* file) {
    Addition& addition = *new (&additionOf(file)) Addition{*file->pMethods, file->pMethods, {}};
    file->pMethods = &addition.methods;
}

void watchDatabase(sqlite3_file* file) {
    takeOver(file);
    additionOf(file).methods.xShmLock = lockDatabase;
}

bool isWatched(const sqlite3_file* database) {
    return database != nullptr && database->pMethods != nullptr &&
           database->pMethods->iVersion >= 2 && database->pMethods->xShmLock == lockDatabase;
}

// A log of which nobody can tell when its writer is done is left as it is.
void joinWritesOf(sqlite3_file* file, const char* name) {
    sqlite3_file* database = sqlite3_database_file_object(name);
    if (!isWatched(database)) return;
    auto* held = new (std::nothrow) Held;
    if (held == nullptr) return;
    held->database = database;
    takeOver(file);
    Addition& addition = additionOf(file);
    addition.held = held;
    addition.methods.xWrite = writeLog;
    addition.methods.xRead = readLog;
    addition.methods.xTruncate = truncateLog;
    addition.methods.xSync = syncLog;
    addition.methods.xFileSize = sizeOfLog;
    addition.methods.xClose = closeLog;
    additionOf(database).held = held;
}

int openFile(sqlite3_vfs* layer, const char* name, sqlite3_file* file, int flags, int* outFlags) {
    auto* below = static_cast<sqlite3_vfs*>(layer->pAppData);
    const int result = below->xOpen(below, name, file, flags, outFlags);
    if (result != SQLITE_OK || file->pMethods == nullptr) return result;
    if ((flags & SQLITE_OPEN_MAIN_DB) != 0 && file->pMethods->iVersion >= 2) watchDatabase(file);
    if ((flags & SQLITE_OPEN_WAL) != 0) joinWritesOf(file, name);
    return result;
}

const char* registerLayer() {
    static_cast<void>(sqlite3_config(SQLITE_CONFIG_STMTJRNL_SPILL, kMostOfStatement));
    sqlite3_vfs* below = sqlite3_vfs_find(nullptr);
    if (below == nullptr) return nullptr;
    constexpr int kAlignment = alignof(Addition);
    sizeBelow = (below->szOsFile + kAlignment - 1) / kAlignment * kAlignment;
    static sqlite3_vfs layer = *below;
    layer.szOsFile = sizeBelow + static_cast<int>(sizeof(Addition));
    layer.pNext = nullptr;
    layer.zName = kLayerName;
    layer.pAppData = below;
    layer.xOpen = openFile;
    return sqlite3_vfs_register(&layer, 0) == SQLITE_OK ? kLayerName : nullptr;
}

}  // namespace

const char* joinedLogLayer() {
    static const char* const name = registerLayer();
    return name;
}

}  // namespace appsync
