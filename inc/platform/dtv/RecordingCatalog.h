// RecordingCatalog: the SQLite catalog of the recordings, beside their files.
//
// One row per recording (the fields of the recording details record, the file's
// path, its PCR and caption PIDs and its state) and the time index of each file
// (elapsed ms -> byte offset) for seeking. The catalog runs in WAL mode: a process
// killed mid-recording leaves every committed row and index point intact.
//
// open() repairs what an earlier process left behind: a row still marked
// "recording" whose file no process holds any more (a recording holds an exclusive
// flock on its file while it writes) becomes "incomplete", its file cut to whole
// packets and its size and duration taken from the file and its index; a file
// of the folder that has no row gets one ("incomplete", indexed by a scan). A
// catalog that SQLite finds damaged is set aside (renamed, never deleted) and
// rebuilt from the files. A catalog locked by another process for longer than the
// busy time-out fails the call with kBusy.
//
// Thread-safe: one connection, guarded by one mutex (the recording's writer thread
// and the service's callers both use it).
#pragma once

#include <sqlite3.h>

#include <cstdint>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

#include "platform/dtv/TsIndexer.h"

namespace TavoPlayer {

class RecordingCatalog {
public:
    static constexpr const char* kFileName = "catalog.db";
    static constexpr int kBusyTimeoutMs = 1000;

    enum class Status { kOk, kBusy, kFailed };

    struct Entry {
        int fileNumName = 0;
        std::string path;
        std::string stationName;
        std::string prgName;
        uint32_t creationTime = 0;   // seconds since the epoch
        uint32_t durationOfRec = 0;  // seconds
        uint32_t sizeOfRec = 0;      // KiB
        uint64_t sizeBytes = 0;
        int32_t recMode = 0;
        int32_t recLocation = 0;
        uint32_t bCanPlay = 0;
        uint32_t playbackDuration = 0;  // milliseconds
        uint32_t recStartTime = 0;      // seconds since the epoch
        uint32_t recEndTime = 0;        // seconds since the epoch
        int32_t videoPid = -1;
        int32_t audioPid = -1;
        int32_t pcrPid = -1;
        int32_t captionPid = -1;
        int32_t isLATM = 0;
        std::string state;  // kRecording, kComplete or kIncomplete
        std::string endReason;
    };
    static constexpr const char* kRecording = "recording";
    static constexpr const char* kComplete = "complete";
    static constexpr const char* kIncomplete = "incomplete";

    explicit RecordingCatalog(std::string dir);
    ~RecordingCatalog();
    RecordingCatalog(const RecordingCatalog&) = delete;
    RecordingCatalog& operator=(const RecordingCatalog&) = delete;

    // Opens or creates the catalog in the folder (which must exist) and repairs it.
    Status open();
    const std::string& dir() const { return mDir; }
    std::string pathOf(int fileNumName) const;

    // The number for a new recording: above every row and every numbered file.
    int nextNumber();
    Status insert(const Entry& entry);
    // Rewrites every field of the row.
    Status update(const Entry& entry);
    // The growing file: size, duration and the new index points, in one transaction.
    Status progress(int fileNumName, uint64_t sizeBytes, uint32_t durationMs, uint32_t endTime,
                    const std::vector<IndexPoint>& points);
    Status remove(int fileNumName);
    std::optional<Entry> get(int fileNumName);
    // Rows whose path starts with `prefix` (compared byte for byte).
    std::vector<Entry> findByPathPrefix(const std::string& prefix);
    std::vector<IndexPoint> loadIndex(int fileNumName);
    Status storeIndex(int fileNumName, const std::vector<IndexPoint>& points);

    // Scans a TS file from `fromOffset` (an index point at `baseMs`, or 0 and 0) to
    // its last whole packet: the index points found there, the time at its last PCR
    // and the offset of its end. False when it cannot be read or holds no packet.
    static bool scanFile(const std::string& path, uint64_t fromOffset, uint32_t baseMs,
                         std::vector<IndexPoint>* points, uint32_t* endMs, uint64_t* endOffset);

private:
    Status openDatabase_l();
    void setAside_l(const char* why);
    void repair_l();
    void recoverFiles_l();
    Status exec_l(const char* sql);
    Status storeIndex_l(int fileNumName, const std::vector<IndexPoint>& points);
    std::vector<IndexPoint> loadIndexLocked(int fileNumName);
    Status update_l(const Entry& entry);
    Status insert_l(const Entry& entry);
    std::vector<Entry> select_l(const char* where, const std::string& text, int number);
    Status fail_l(const char* what, int rc);

    const std::string mDir;
    std::mutex mLock;
    sqlite3* mDb = nullptr;  // mLock
};

}  // namespace TavoPlayer
