// Connection: one AF_UNIX SOCK_SEQPACKET connection between two processes, carrying
// binder transactions both ways (the frame layout is in docs/protocol.md).
//
// Threads: one I/O thread per connection receives every frame and sends what could
// not be sent at once; incoming two-way transactions run on the process's binder
// threads (ProcessState), incoming one-way transactions run there too but one at a
// time per connection, in the order they were sent. A caller of a two-way
// transaction waits for its reply or for the peer's hang-up.
//
// Objects: a local object written into a parcel is exported on the connection under
// an id (the service's root object is id 1); the peer sees it as a BpBinder on the
// same connection. The exporter keeps the object while the peer holds references,
// counted by the number of times it was sent; a proxy that goes returns its count.
//
// A one-way frame that the peer does not take at once waits in a bounded queue;
// when the queue is full the call fails with WOULD_BLOCK, so a slow or stuck reader
// never blocks the sender. Replies and two-way requests always queue; a peer that
// lets them pile up past a hard limit is hung up on.
#pragma once

#include <sys/types.h>

#include <condition_variable>
#include <cstdint>
#include <deque>
#include <map>
#include <memory>
#include <mutex>
#include <thread>
#include <vector>

#include "platform/binder/IBinder.h"

namespace android {

class BpBinder;
class Parcel;

class Connection : public RefBase {
public:
    // Wire constants, see docs/protocol.md.
    static constexpr uint32_t kMagic = 0x31425654;  // "TVB1"
    static constexpr uint32_t CMD_TRANSACTION = 1;
    static constexpr uint32_t CMD_REPLY = 2;
    static constexpr uint32_t CMD_RELEASE = 3;
    static constexpr size_t kHeaderBytes = 40;
    static constexpr uint64_t kRootHandle = 1;
    static constexpr size_t kMaxFrameBytes = 256 * 1024;
    static constexpr size_t kMaxFds = 253;  // the kernel's SCM_MAX_FD
    // The bound on one-way frames waiting for the peer.
    static constexpr size_t kMaxQueuedOneway = 256;
    static constexpr size_t kMaxQueuedBytes = 4 * 1024 * 1024;
    // Past this much unsent data of any kind the peer is taken as stuck.
    static constexpr size_t kHardQueuedBytes = 64 * 1024 * 1024;
    // One-way transactions received but not yet run; past it reading pauses.
    static constexpr size_t kMaxPendingIncoming = 1024;

    // Takes ownership of `fd`, a connected SOCK_SEQPACKET socket. `root` is the object
    // served as id 1 (the service, on an accepted connection), or null.
    static sp<Connection> create(int fd, const sp<IBinder>& root);
    // Connects to the socket at `path`; null (and *status) on failure.
    static sp<Connection> connect(const char* path, status_t* status = nullptr);

    ~Connection() override;

    // Starts the I/O thread; the connection then registers with ProcessState.
    status_t start();
    // A proxy for the peer's root object (a service's own binder).
    sp<IBinder> rootProxy();
    status_t transact(uint64_t handle, uint32_t code, const Parcel& data, Parcel* reply,
                      uint32_t flags);
    bool isAlive() const;
    // Hangs up; the I/O thread ends and the peer sees the connection die.
    void hangUp();
    // Waits for the I/O thread to end (not from the I/O thread itself); at once if it
    // has ended and let itself go.
    void join();

    pid_t peerPid() const { return mPeerPid; }
    uid_t peerUid() const { return mPeerUid; }

    // From BpBinder's destructor.
    void proxyDestroyed(uint64_t handle, BpBinder* proxy, uint32_t remoteRefs);

private:
    struct Pending;
    struct Incoming;
    struct Outgoing {
        std::vector<uint8_t> bytes;
        std::vector<int> fds;  // owned while queued
        bool oneway;
    };

    Connection(int fd, const sp<IBinder>& root);

    void ioLoop();
    void letThreadGo();
    bool readFrames();
    bool handleFrame(const uint8_t* frame, size_t len, std::vector<int>& fds);
    bool flushQueue();
    void die();
    void dispatch(std::unique_ptr<Incoming> incoming);
    void execute(Incoming& incoming);
    void drainOneway();

    // Builds the frame for `parcel` (exporting local objects on the way).
    status_t flatten(uint32_t cmd, uint32_t flags, uint32_t codeOrStatus, uint64_t target,
                     uint64_t tid, const Parcel* parcel, Outgoing* out);
    status_t unflatten(const uint8_t* data, size_t dataSize, const uint8_t* offsets,
                       size_t objectCount, std::vector<int>& fds, Parcel* out);
    status_t send(Outgoing&& frame);
    uint64_t exportObject_l(const sp<IBinder>& binder);
    sp<IBinder> proxyFor_l(uint64_t handle);
    void wake();
    void maybeHangUpIdle_l();

    const int mFd;
    const int mWakeFd;  // eventfd: queued output, paused input resumed, hang-up
    const sp<IBinder> mRoot;
    const bool mOutgoing;  // we connected: close once nothing is shared any more
    pid_t mPeerPid = -1;
    uid_t mPeerUid = static_cast<uid_t>(-1);
    std::mutex mThreadLock;  // guards mThread: join() and the ending thread race for it
    std::thread mThread;
    std::thread::id mThreadId;
    std::vector<uint8_t> mRecvBuffer;   // the I/O thread's only
    std::vector<uint8_t> mRecvControl;  // the I/O thread's only

    mutable std::mutex mLock;  // guards the tables, pending calls, state and incoming queue
    bool mDead = false;
    bool mHungUp = false;
    uint64_t mNextTid = 1;
    uint64_t mNextExportId = kRootHandle + 1;
    std::map<uint64_t, Pending*> mPending;
    struct Export {
        sp<IBinder> binder;
        uint64_t refs;
    };
    std::map<uint64_t, Export> mExports;
    std::map<IBinder*, uint64_t> mExportIds;
    struct ProxyEntry {
        BpBinder* raw;
        wp<BpBinder> weak;
    };
    std::map<uint64_t, ProxyEntry> mProxies;
    std::deque<std::unique_ptr<Incoming>> mOneway;
    bool mOnewayRunning = false;

    std::mutex mSendLock;  // guards the socket's send side and the queue below
    std::deque<Outgoing> mQueue;
    size_t mQueuedOneway = 0;
    size_t mQueuedBytes = 0;
    bool mOverflowLogged = false;
};

}  // namespace android
