#include "platform/dtv/RecordingCatalog.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <ctime>
#include <memory>

#include "platform/os/Trace.h"

namespace TavoPlayer {

namespace {

constexpr size_t kPacket = 188;
constexpr size_t kScanChunk = 1 << 20;

const char* kSchema =
    "CREATE TABLE IF NOT EXISTS recordings("
    " fileNumName INTEGER PRIMARY KEY, path TEXT NOT NULL UNIQUE,"
    " stationName TEXT, prgName TEXT, creationTime INTEGER, durationOfRec INTEGER,"
    " sizeOfRec INTEGER, sizeBytes INTEGER, recMode INTEGER, recLocation INTEGER,"
    " bCanPlay INTEGER, playbackDuration INTEGER, recStartTime INTEGER, recEndTime INTEGER,"
    " videoPid INTEGER, audioPid INTEGER, pcrPid INTEGER, captionPid INTEGER, isLATM INTEGER,"
    " state TEXT NOT NULL, endReason TEXT);"
    "CREATE TABLE IF NOT EXISTS seekIndex(fileNumName INTEGER NOT NULL, timeMs INTEGER NOT NULL,"
    " offset INTEGER NOT NULL, PRIMARY KEY(fileNumName, timeMs)) WITHOUT ROWID;";

const char* kColumns =
    "fileNumName, path, stationName, prgName, creationTime, durationOfRec, sizeOfRec, sizeBytes,"
    " recMode, recLocation, bCanPlay, playbackDuration, recStartTime, recEndTime, videoPid,"
    " audioPid, pcrPid, captionPid, isLATM, state, endReason";

struct StatementDeleter {
    void operator()(sqlite3_stmt* s) const { sqlite3_finalize(s); }
};
using Statement = std::unique_ptr<sqlite3_stmt, StatementDeleter>;

Statement prepare(sqlite3* db, const char* sql) {
    sqlite3_stmt* s = nullptr;
    if (sqlite3_prepare_v2(db, sql, -1, &s, nullptr) != SQLITE_OK)
        return nullptr;
    return Statement(s);
}

std::string text(sqlite3_stmt* s, int column) {
    const unsigned char* t = sqlite3_column_text(s, column);
    return t == nullptr ? std::string() : std::string(reinterpret_cast<const char*>(t));
}

bool damaged(int rc) {
    rc &= 0xFF;
    return rc == SQLITE_CORRUPT || rc == SQLITE_NOTADB;
}

// The number a recording file is named by ("12.ts" -> 12), or -1.
int numberOf(const char* name) {
    char* end = nullptr;
    errno = 0;
    const long n = strtol(name, &end, 10);
    if (errno != 0 || end == name || n <= 0 || n > INT32_MAX || strcmp(end, ".ts") != 0)
        return -1;
    return static_cast<int>(n);
}

}  // namespace

RecordingCatalog::RecordingCatalog(std::string dir) : mDir(std::move(dir)) {}

RecordingCatalog::~RecordingCatalog() {
    std::lock_guard<std::mutex> lock(mLock);
    if (mDb != nullptr)
        sqlite3_close_v2(mDb);
}

std::string RecordingCatalog::pathOf(int fileNumName) const {
    return mDir + "/" + std::to_string(fileNumName) + ".ts";
}

RecordingCatalog::Status RecordingCatalog::fail_l(const char* what, int rc) {
    if ((rc & 0xFF) == SQLITE_BUSY || (rc & 0xFF) == SQLITE_LOCKED) {
        TAVO_LOGE("%s: the recordings catalog %s/%s is locked by another process (%s)\n", what,
                  mDir.c_str(), kFileName, sqlite3_errstr(rc));
        return Status::kBusy;
    }
    TAVO_LOGE("%s: recordings catalog %s/%s: %s\n", what, mDir.c_str(), kFileName,
              mDb != nullptr ? sqlite3_errmsg(mDb) : sqlite3_errstr(rc));
    return Status::kFailed;
}

RecordingCatalog::Status RecordingCatalog::exec_l(const char* sql) {
    char* error = nullptr;
    const int rc = sqlite3_exec(mDb, sql, nullptr, nullptr, &error);
    sqlite3_free(error);
    if (rc != SQLITE_OK)
        return fail_l("RecordingCatalog", rc);
    return Status::kOk;
}

RecordingCatalog::Status RecordingCatalog::open() {
    std::lock_guard<std::mutex> lock(mLock);
    if (mDb != nullptr)
        return Status::kOk;
    Status status = openDatabase_l();
    if (status != Status::kOk)
        return status;
    repair_l();
    recoverFiles_l();
    return Status::kOk;
}

RecordingCatalog::Status RecordingCatalog::openDatabase_l() {
    const std::string path = mDir + "/" + kFileName;
    for (int attempt = 0; attempt < 2; ++attempt) {
        int rc = sqlite3_open_v2(path.c_str(), &mDb, SQLITE_OPEN_READWRITE | SQLITE_OPEN_CREATE,
                                 nullptr);
        if (rc != SQLITE_OK) {
            const Status status = fail_l("RecordingCatalog::open", rc);
            sqlite3_close_v2(mDb);
            mDb = nullptr;
            return status;
        }
        sqlite3_busy_timeout(mDb, kBusyTimeoutMs);
        // WAL: a writer killed mid-transaction leaves the committed catalog whole,
        // and readers (a clip being played) never wait for the recording's updates.
        rc = sqlite3_exec(mDb, "PRAGMA journal_mode=WAL;", nullptr, nullptr, nullptr);
        std::string check;
        if (rc == SQLITE_OK) {
            Statement s = prepare(mDb, "PRAGMA quick_check;");
            rc = s ? sqlite3_step(s.get()) : sqlite3_errcode(mDb);
            if (rc == SQLITE_ROW) {
                check = text(s.get(), 0);
                rc = SQLITE_OK;
            }
        }
        if (rc == SQLITE_OK && check != "ok") {
            TAVO_LOGE("%s: recordings catalog %s fails its integrity check: %s\n",
                      "RecordingCatalog::open", path.c_str(), check.c_str());
            rc = SQLITE_CORRUPT;
        }
        if (rc == SQLITE_OK) {
            char* error = nullptr;
            rc = sqlite3_exec(mDb, kSchema, nullptr, nullptr, &error);
            sqlite3_free(error);
        }
        if (rc == SQLITE_OK)
            return Status::kOk;
        if (!damaged(rc) || attempt > 0) {
            const Status status = fail_l("RecordingCatalog::open", rc);
            sqlite3_close_v2(mDb);
            mDb = nullptr;
            return status;
        }
        sqlite3_close_v2(mDb);
        mDb = nullptr;
        setAside_l(sqlite3_errstr(rc));
    }
    return Status::kFailed;
}

void RecordingCatalog::setAside_l(const char* why) {
    // Kept, not deleted: whatever it still holds may matter to someone.
    const std::string path = mDir + "/" + kFileName;
    const std::string aside = path + ".damaged-" + std::to_string(time(nullptr));
    for (const char* suffix : {"", "-wal", "-shm"}) {
        const std::string from = path + suffix;
        if (access(from.c_str(), F_OK) == 0)
            rename(from.c_str(), (aside + suffix).c_str());
    }
    TAVO_LOGE(
        "%s: recordings catalog %s is damaged (%s); set aside as %s and rebuilt from the "
        "recording files\n",
        "RecordingCatalog::open", path.c_str(), why, aside.c_str());
}

bool RecordingCatalog::scanFile(const std::string& path, uint64_t fromOffset, uint32_t baseMs,
                                std::vector<IndexPoint>* points, uint32_t* endMs,
                                uint64_t* endOffset) {
    const int fd = ::open(path.c_str(), O_RDONLY | O_CLOEXEC);
    if (fd < 0)
        return false;
    TsIndexer indexer;
    std::vector<uint8_t> buffer(kScanChunk);
    uint64_t offset = fromOffset;
    bool ok = true;
    for (;;) {
        const ssize_t n = pread(fd, buffer.data(), buffer.size(), static_cast<off_t>(offset));
        if (n < 0 && errno == EINTR)
            continue;
        if (n <= 0) {
            ok = n == 0;
            break;
        }
        const size_t whole = static_cast<size_t>(n) / kPacket * kPacket;
        for (size_t i = 0; i < whole; i += kPacket)
            indexer.push(&buffer[i], offset + i);
        offset += whole;
        if (whole == 0 || static_cast<size_t>(n) < buffer.size())
            break;
    }
    close(fd);
    if (points != nullptr) {
        *points = indexer.points();
        for (IndexPoint& p : *points)
            p.timeMs += baseMs;
    }
    if (endMs != nullptr)
        *endMs = baseMs + indexer.elapsedMs();
    if (endOffset != nullptr)
        *endOffset = offset;
    return ok && offset > fromOffset;
}

void RecordingCatalog::repair_l() {
    std::vector<Entry> open = select_l("state = ?", kRecording, 0);
    for (Entry& e : open) {
        const int fd = ::open(e.path.c_str(), O_RDWR | O_CLOEXEC);
        if (fd < 0) {
            TAVO_LOGW("%s: recording %d was interrupted and its file %s is gone: %s\n",
                      "RecordingCatalog::repair", e.fileNumName, e.path.c_str(), strerror(errno));
            e.state = kIncomplete;
            e.endReason = "interrupted; file missing";
            e.bCanPlay = 0;
            update_l(e);
            continue;
        }
        if (flock(fd, LOCK_EX | LOCK_NB) != 0) {
            close(fd);  // a live process is still writing it
            continue;
        }
        struct stat st {};
        fstat(fd, &st);
        // A kill can land between two writes of a packet: keep whole packets only.
        const uint64_t whole = static_cast<uint64_t>(st.st_size) / kPacket * kPacket;
        if (whole != static_cast<uint64_t>(st.st_size) &&
            ftruncate(fd, static_cast<off_t>(whole)) != 0)
            TAVO_LOGW("%s: cannot cut %s to whole packets: %s\n", "RecordingCatalog::repair",
                      e.path.c_str(), strerror(errno));
        close(fd);
        std::vector<IndexPoint> index = loadIndexLocked(e.fileNumName);
        size_t keep = 0;
        while (keep < index.size() && index[keep].offset < whole)
            ++keep;
        // The last second or so reached the file after the last catalog update: the
        // time line and the index are read on from the last point the catalog has.
        const IndexPoint from = keep > 0 ? index[keep - 1] : IndexPoint{};
        std::vector<IndexPoint> tail;
        uint32_t durationMs = from.timeMs;
        scanFile(e.path, from.offset, from.timeMs, &tail, &durationMs, nullptr);
        if (keep < index.size()) {
            Statement s =
                prepare(mDb, "DELETE FROM seekIndex WHERE fileNumName = ? AND offset >= ?;");
            if (s) {
                sqlite3_bind_int(s.get(), 1, e.fileNumName);
                sqlite3_bind_int64(s.get(), 2, static_cast<sqlite3_int64>(whole));
                sqlite3_step(s.get());
            }
        }
        if (!tail.empty() && keep > 0 && tail.front().timeMs == from.timeMs)
            tail.erase(tail.begin());
        storeIndex_l(e.fileNumName, tail);
        e.sizeBytes = whole;
        e.sizeOfRec = static_cast<uint32_t>(whole / 1024);
        e.playbackDuration = durationMs;
        e.durationOfRec = e.playbackDuration / 1000;
        if (e.recEndTime == 0)
            e.recEndTime = static_cast<uint32_t>(st.st_mtime);
        e.state = kIncomplete;
        e.endReason = "interrupted";
        update_l(e);
        TAVO_LOGW("%s: recording %d (%s) was interrupted; kept as incomplete: %llu bytes, %u ms\n",
                  "RecordingCatalog::repair", e.fileNumName, e.path.c_str(),
                  static_cast<unsigned long long>(whole), e.playbackDuration);
    }
}

void RecordingCatalog::recoverFiles_l() {
    DIR* dir = opendir(mDir.c_str());
    if (dir == nullptr)
        return;
    std::vector<int> numbers;
    while (const dirent* d = readdir(dir)) {
        const int n = numberOf(d->d_name);
        if (n > 0)
            numbers.push_back(n);
    }
    closedir(dir);
    for (int n : numbers) {
        const std::string path = pathOf(n);
        if (!select_l("path = ?", path, 0).empty())
            continue;
        // A file held by a live recording is not ours to take.
        const int fd = ::open(path.c_str(), O_RDONLY | O_CLOEXEC);
        if (fd < 0)
            continue;
        const bool busy = flock(fd, LOCK_SH | LOCK_NB) != 0;
        struct stat st {};
        fstat(fd, &st);
        close(fd);
        if (busy)
            continue;
        Entry e;
        std::vector<IndexPoint> points;
        uint32_t durationMs = 0;
        if (!scanFile(path, 0, 0, &points, &durationMs, &e.sizeBytes)) {
            TAVO_LOGW("%s: %s holds no TS packets; left alone\n", "RecordingCatalog::recover",
                      path.c_str());
            continue;
        }
        e.fileNumName = n;
        e.path = path;
        e.creationTime = static_cast<uint32_t>(st.st_mtime);
        e.recStartTime = e.creationTime;
        e.recEndTime = e.creationTime;
        e.sizeOfRec = static_cast<uint32_t>(e.sizeBytes / 1024);
        e.playbackDuration = durationMs;
        e.durationOfRec = durationMs / 1000;
        e.bCanPlay = 1;
        e.state = kIncomplete;
        e.endReason = "recovered from the file";
        if (insert_l(e) == Status::kOk)
            storeIndex_l(n, points);
        TAVO_LOGW("%s: %s had no catalog entry; recovered as recording %d (%u ms)\n",
                  "RecordingCatalog::recover", path.c_str(), n, durationMs);
    }
}

int RecordingCatalog::nextNumber() {
    std::lock_guard<std::mutex> lock(mLock);
    int highest = 0;
    if (mDb != nullptr) {
        Statement s = prepare(mDb, "SELECT MAX(fileNumName) FROM recordings;");
        if (s && sqlite3_step(s.get()) == SQLITE_ROW)
            highest = sqlite3_column_int(s.get(), 0);
    }
    if (DIR* dir = opendir(mDir.c_str())) {
        while (const dirent* d = readdir(dir))
            highest = std::max(highest, numberOf(d->d_name));
        closedir(dir);
    }
    return highest + 1;
}

RecordingCatalog::Status RecordingCatalog::insert(const Entry& entry) {
    std::lock_guard<std::mutex> lock(mLock);
    return insert_l(entry);
}

RecordingCatalog::Status RecordingCatalog::update(const Entry& entry) {
    std::lock_guard<std::mutex> lock(mLock);
    return update_l(entry);
}

namespace {

void bindEntry(sqlite3_stmt* s, const RecordingCatalog::Entry& e) {
    int i = 1;
    sqlite3_bind_int(s, i++, e.fileNumName);
    sqlite3_bind_text(s, i++, e.path.c_str(), -1, SQLITE_TRANSIENT);
    sqlite3_bind_text(s, i++, e.stationName.c_str(), -1, SQLITE_TRANSIENT);
    sqlite3_bind_text(s, i++, e.prgName.c_str(), -1, SQLITE_TRANSIENT);
    sqlite3_bind_int64(s, i++, e.creationTime);
    sqlite3_bind_int64(s, i++, e.durationOfRec);
    sqlite3_bind_int64(s, i++, e.sizeOfRec);
    sqlite3_bind_int64(s, i++, static_cast<sqlite3_int64>(e.sizeBytes));
    sqlite3_bind_int(s, i++, e.recMode);
    sqlite3_bind_int(s, i++, e.recLocation);
    sqlite3_bind_int64(s, i++, e.bCanPlay);
    sqlite3_bind_int64(s, i++, e.playbackDuration);
    sqlite3_bind_int64(s, i++, e.recStartTime);
    sqlite3_bind_int64(s, i++, e.recEndTime);
    sqlite3_bind_int(s, i++, e.videoPid);
    sqlite3_bind_int(s, i++, e.audioPid);
    sqlite3_bind_int(s, i++, e.pcrPid);
    sqlite3_bind_int(s, i++, e.captionPid);
    sqlite3_bind_int(s, i++, e.isLATM);
    sqlite3_bind_text(s, i++, e.state.c_str(), -1, SQLITE_TRANSIENT);
    sqlite3_bind_text(s, i++, e.endReason.c_str(), -1, SQLITE_TRANSIENT);
}

RecordingCatalog::Entry readEntry(sqlite3_stmt* s) {
    RecordingCatalog::Entry e;
    int i = 0;
    e.fileNumName = sqlite3_column_int(s, i++);
    e.path = text(s, i++);
    e.stationName = text(s, i++);
    e.prgName = text(s, i++);
    e.creationTime = static_cast<uint32_t>(sqlite3_column_int64(s, i++));
    e.durationOfRec = static_cast<uint32_t>(sqlite3_column_int64(s, i++));
    e.sizeOfRec = static_cast<uint32_t>(sqlite3_column_int64(s, i++));
    e.sizeBytes = static_cast<uint64_t>(sqlite3_column_int64(s, i++));
    e.recMode = sqlite3_column_int(s, i++);
    e.recLocation = sqlite3_column_int(s, i++);
    e.bCanPlay = static_cast<uint32_t>(sqlite3_column_int64(s, i++));
    e.playbackDuration = static_cast<uint32_t>(sqlite3_column_int64(s, i++));
    e.recStartTime = static_cast<uint32_t>(sqlite3_column_int64(s, i++));
    e.recEndTime = static_cast<uint32_t>(sqlite3_column_int64(s, i++));
    e.videoPid = sqlite3_column_int(s, i++);
    e.audioPid = sqlite3_column_int(s, i++);
    e.pcrPid = sqlite3_column_int(s, i++);
    e.captionPid = sqlite3_column_int(s, i++);
    e.isLATM = sqlite3_column_int(s, i++);
    e.state = text(s, i++);
    e.endReason = text(s, i++);
    return e;
}

}  // namespace

RecordingCatalog::Status RecordingCatalog::insert_l(const Entry& entry) {
    if (mDb == nullptr)
        return Status::kFailed;
    const std::string sql = std::string("INSERT INTO recordings(") + kColumns +
                            ") VALUES(?,?,?,?,?,?,?,?,?,?,?,?,?,?,?,?,?,?,?,?,?);";
    Statement s = prepare(mDb, sql.c_str());
    if (!s)
        return fail_l("RecordingCatalog::insert", sqlite3_errcode(mDb));
    bindEntry(s.get(), entry);
    const int rc = sqlite3_step(s.get());
    return rc == SQLITE_DONE ? Status::kOk : fail_l("RecordingCatalog::insert", rc);
}

RecordingCatalog::Status RecordingCatalog::update_l(const Entry& entry) {
    if (mDb == nullptr)
        return Status::kFailed;
    const std::string sql = std::string("REPLACE INTO recordings(") + kColumns +
                            ") VALUES(?,?,?,?,?,?,?,?,?,?,?,?,?,?,?,?,?,?,?,?,?);";
    Statement s = prepare(mDb, sql.c_str());
    if (!s)
        return fail_l("RecordingCatalog::update", sqlite3_errcode(mDb));
    bindEntry(s.get(), entry);
    const int rc = sqlite3_step(s.get());
    return rc == SQLITE_DONE ? Status::kOk : fail_l("RecordingCatalog::update", rc);
}

RecordingCatalog::Status RecordingCatalog::progress(int fileNumName, uint64_t sizeBytes,
                                                    uint32_t durationMs, uint32_t endTime,
                                                    const std::vector<IndexPoint>& points) {
    std::lock_guard<std::mutex> lock(mLock);
    if (mDb == nullptr)
        return Status::kFailed;
    int rc = sqlite3_exec(mDb, "BEGIN IMMEDIATE;", nullptr, nullptr, nullptr);
    if (rc != SQLITE_OK)
        return fail_l("RecordingCatalog::progress", rc);
    Statement s =
        prepare(mDb,
                "UPDATE recordings SET sizeBytes = ?, sizeOfRec = ?, playbackDuration = ?,"
                " durationOfRec = ?, recEndTime = ? WHERE fileNumName = ?;");
    if (s) {
        sqlite3_bind_int64(s.get(), 1, static_cast<sqlite3_int64>(sizeBytes));
        sqlite3_bind_int64(s.get(), 2, static_cast<sqlite3_int64>(sizeBytes / 1024));
        sqlite3_bind_int64(s.get(), 3, durationMs);
        sqlite3_bind_int64(s.get(), 4, durationMs / 1000);
        sqlite3_bind_int64(s.get(), 5, endTime);
        sqlite3_bind_int(s.get(), 6, fileNumName);
        rc = sqlite3_step(s.get());
    } else {
        rc = sqlite3_errcode(mDb);
    }
    Status status = rc == SQLITE_DONE ? Status::kOk : fail_l("RecordingCatalog::progress", rc);
    if (status == Status::kOk)
        status = storeIndex_l(fileNumName, points);
    rc = sqlite3_exec(mDb, status == Status::kOk ? "COMMIT;" : "ROLLBACK;", nullptr, nullptr,
                      nullptr);
    if (rc != SQLITE_OK && status == Status::kOk)
        status = fail_l("RecordingCatalog::progress", rc);
    return status;
}

RecordingCatalog::Status RecordingCatalog::remove(int fileNumName) {
    std::lock_guard<std::mutex> lock(mLock);
    if (mDb == nullptr)
        return Status::kFailed;
    for (const char* sql : {"DELETE FROM seekIndex WHERE fileNumName = ?;",
                            "DELETE FROM recordings WHERE fileNumName = ?;"}) {
        Statement s = prepare(mDb, sql);
        if (!s)
            return fail_l("RecordingCatalog::remove", sqlite3_errcode(mDb));
        sqlite3_bind_int(s.get(), 1, fileNumName);
        const int rc = sqlite3_step(s.get());
        if (rc != SQLITE_DONE)
            return fail_l("RecordingCatalog::remove", rc);
    }
    return Status::kOk;
}

std::vector<RecordingCatalog::Entry> RecordingCatalog::select_l(const char* where,
                                                                const std::string& value,
                                                                int number) {
    std::vector<Entry> out;
    if (mDb == nullptr)
        return out;
    const std::string sql = std::string("SELECT ") + kColumns + " FROM recordings WHERE " + where +
                            " ORDER BY fileNumName;";
    Statement s = prepare(mDb, sql.c_str());
    if (!s) {
        fail_l("RecordingCatalog::select", sqlite3_errcode(mDb));
        return out;
    }
    if (sqlite3_bind_parameter_count(s.get()) >= 1) {
        if (value.empty() && number != 0)
            sqlite3_bind_int(s.get(), 1, number);
        else
            sqlite3_bind_text(s.get(), 1, value.c_str(), -1, SQLITE_TRANSIENT);
    }
    int rc;
    while ((rc = sqlite3_step(s.get())) == SQLITE_ROW)
        out.push_back(readEntry(s.get()));
    if (rc != SQLITE_DONE)
        fail_l("RecordingCatalog::select", rc);
    return out;
}

std::optional<RecordingCatalog::Entry> RecordingCatalog::get(int fileNumName) {
    std::lock_guard<std::mutex> lock(mLock);
    std::vector<Entry> rows = select_l("fileNumName = ?", "", fileNumName);
    if (rows.empty())
        return std::nullopt;
    return rows.front();
}

std::vector<RecordingCatalog::Entry> RecordingCatalog::findByPathPrefix(const std::string& prefix) {
    std::lock_guard<std::mutex> lock(mLock);
    // substr rather than LIKE: a path may hold '%' or '_', and LIKE ignores case.
    return select_l("substr(path, 1, length(?1)) = ?1", prefix, 0);
}

std::vector<IndexPoint> RecordingCatalog::loadIndexLocked(int fileNumName) {
    std::vector<IndexPoint> out;
    if (mDb == nullptr)
        return out;
    Statement s =
        prepare(mDb, "SELECT timeMs, offset FROM seekIndex WHERE fileNumName = ? ORDER BY timeMs;");
    if (!s)
        return out;
    sqlite3_bind_int(s.get(), 1, fileNumName);
    while (sqlite3_step(s.get()) == SQLITE_ROW) {
        out.push_back({static_cast<uint32_t>(sqlite3_column_int64(s.get(), 0)),
                       static_cast<uint64_t>(sqlite3_column_int64(s.get(), 1))});
    }
    return out;
}

std::vector<IndexPoint> RecordingCatalog::loadIndex(int fileNumName) {
    std::lock_guard<std::mutex> lock(mLock);
    return loadIndexLocked(fileNumName);
}

RecordingCatalog::Status RecordingCatalog::storeIndex(int fileNumName,
                                                      const std::vector<IndexPoint>& points) {
    std::lock_guard<std::mutex> lock(mLock);
    if (mDb == nullptr)
        return Status::kFailed;
    int rc = sqlite3_exec(mDb, "BEGIN IMMEDIATE;", nullptr, nullptr, nullptr);
    if (rc != SQLITE_OK)
        return fail_l("RecordingCatalog::storeIndex", rc);
    const Status status = storeIndex_l(fileNumName, points);
    sqlite3_exec(mDb, status == Status::kOk ? "COMMIT;" : "ROLLBACK;", nullptr, nullptr, nullptr);
    return status;
}

RecordingCatalog::Status RecordingCatalog::storeIndex_l(int fileNumName,
                                                        const std::vector<IndexPoint>& points) {
    if (points.empty())
        return Status::kOk;
    Statement s = prepare(mDb,
                          "INSERT OR REPLACE INTO seekIndex(fileNumName, timeMs, offset)"
                          " VALUES(?, ?, ?);");
    if (!s)
        return fail_l("RecordingCatalog::storeIndex", sqlite3_errcode(mDb));
    for (const IndexPoint& p : points) {
        sqlite3_reset(s.get());
        sqlite3_bind_int(s.get(), 1, fileNumName);
        sqlite3_bind_int64(s.get(), 2, p.timeMs);
        sqlite3_bind_int64(s.get(), 3, static_cast<sqlite3_int64>(p.offset));
        const int rc = sqlite3_step(s.get());
        if (rc != SQLITE_DONE)
            return fail_l("RecordingCatalog::storeIndex", rc);
    }
    return Status::kOk;
}

}  // namespace TavoPlayer
