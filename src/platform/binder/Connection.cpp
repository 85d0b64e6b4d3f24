#include "platform/binder/Connection.h"

#include <fcntl.h>
#include <poll.h>
#include <pthread.h>
#include <sys/eventfd.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cstring>

#include "platform/binder/BpBinder.h"
#include "platform/binder/IPCThreadState.h"
#include "platform/binder/Parcel.h"
#include "platform/binder/ProcessState.h"
#include "platform/os/Trace.h"

namespace android {

namespace {

// Every wait is bounded so that a hang-up or a stop is seen within one period.
constexpr int kPollMs = 100;
constexpr auto kReplyWaitStep = std::chrono::milliseconds(100);
// Sockets get this much kernel buffer (the kernel caps it at twice net.core.wmem_max),
// so a frame of kMaxFrameBytes fits.
constexpr int kSocketBufferBytes = 1024 * 1024;

void putLe32(uint8_t* p, uint32_t v) {
    for (int i = 0; i < 4; ++i)
        p[i] = static_cast<uint8_t>(v >> (8 * i));
}

void putLe64(uint8_t* p, uint64_t v) {
    putLe32(p, static_cast<uint32_t>(v));
    putLe32(p + 4, static_cast<uint32_t>(v >> 32));
}

uint32_t getLe32(const uint8_t* p) {
    return static_cast<uint32_t>(p[0]) | static_cast<uint32_t>(p[1]) << 8 |
           static_cast<uint32_t>(p[2]) << 16 | static_cast<uint32_t>(p[3]) << 24;
}

uint64_t getLe64(const uint8_t* p) {
    return static_cast<uint64_t>(getLe32(p)) | static_cast<uint64_t>(getLe32(p + 4)) << 32;
}

void closeAll(std::vector<int>& fds) {
    for (int fd : fds) {
        if (fd >= 0)
            close(fd);
    }
    fds.clear();
}

}  // namespace

struct Connection::Pending {
    std::condition_variable cv;
    bool done = false;
    status_t status = OK;
    Parcel* reply = nullptr;
};

struct Connection::Incoming {
    sp<IBinder> target;
    uint32_t code = 0;
    uint32_t flags = 0;
    uint64_t tid = 0;
    Parcel data;
};

Connection::Connection(int fd, const sp<IBinder>& root)
    : mFd(fd),
      mWakeFd(eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)),
      mRoot(root),
      mOutgoing(root == nullptr) {
    ucred cred{};
    socklen_t len = sizeof cred;
    if (getsockopt(mFd, SOL_SOCKET, SO_PEERCRED, &cred, &len) == 0) {
        mPeerPid = cred.pid;
        mPeerUid = cred.uid;
    }
    const int size = kSocketBufferBytes;
    setsockopt(mFd, SOL_SOCKET, SO_SNDBUF, &size, sizeof size);
    setsockopt(mFd, SOL_SOCKET, SO_RCVBUF, &size, sizeof size);
}

Connection::~Connection() {
    // The I/O thread holds a reference until it has let itself go or been taken by
    // join(), so no thread is left to wait for here.
    for (Outgoing& frame : mQueue)
        closeAll(frame.fds);
    close(mFd);
    if (mWakeFd >= 0)
        close(mWakeFd);
}

sp<Connection> Connection::create(int fd, const sp<IBinder>& root) {
    if (fd < 0)
        return nullptr;
    sp<Connection> connection = new Connection(fd, root);
    if (connection->mWakeFd < 0)
        return nullptr;
    return connection;
}

sp<Connection> Connection::connect(const char* path, status_t* status) {
    status_t dummy;
    status_t& err = status != nullptr ? *status : dummy;
    sockaddr_un addr{};
    addr.sun_family = AF_UNIX;
    if (strlen(path) >= sizeof addr.sun_path) {
        err = BAD_VALUE;
        return nullptr;
    }
    strcpy(addr.sun_path, path);
    const int fd = socket(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0);
    if (fd < 0) {
        err = -errno;
        return nullptr;
    }
    if (::connect(fd, reinterpret_cast<sockaddr*>(&addr), sizeof addr) != 0) {
        err = errno == ENOENT || errno == ECONNREFUSED ? NAME_NOT_FOUND : -errno;
        close(fd);
        return nullptr;
    }
    sp<Connection> connection = create(fd, nullptr);
    if (connection == nullptr || connection->start() != OK) {
        err = NO_MEMORY;
        return nullptr;
    }
    err = OK;
    return connection;
}

status_t Connection::start() {
    sp<Connection> self(this);
    {
        std::lock_guard<std::mutex> lock(mThreadLock);
        mThread = std::thread([self] {
            pthread_setname_np(pthread_self(), "BinderIO");
            self->ioLoop();
            self->letThreadGo();
        });
        mThreadId = mThread.get_id();
    }
    ProcessState::self()->addConnection(self);
    return OK;
}

sp<IBinder> Connection::rootProxy() {
    std::lock_guard<std::mutex> lock(mLock);
    auto it = mProxies.find(kRootHandle);
    if (it != mProxies.end()) {
        sp<BpBinder> proxy = it->second.weak.promote();
        if (proxy != nullptr)
            return proxy;
    }
    sp<BpBinder> proxy = new BpBinder(this, kRootHandle);
    mProxies[kRootHandle] = ProxyEntry{proxy.get(), proxy};
    return proxy;
}

bool Connection::isAlive() const {
    std::lock_guard<std::mutex> lock(mLock);
    return !mDead;
}

void Connection::wake() {
    const uint64_t one = 1;
    [[maybe_unused]] ssize_t n = ::write(mWakeFd, &one, sizeof one);
}

void Connection::hangUp() {
    {
        std::lock_guard<std::mutex> lock(mLock);
        mHungUp = true;
    }
    shutdown(mFd, SHUT_RDWR);
    wake();
}

void Connection::join() {
    if (std::this_thread::get_id() == mThreadId)
        return;
    std::thread thread;
    {
        std::lock_guard<std::mutex> lock(mThreadLock);
        thread.swap(mThread);
    }
    if (thread.joinable())
        thread.join();
}

void Connection::letThreadGo() {
    // A connection whose peer went away can outlive its I/O thread for as long as
    // proxies hold it, often until the process exits; a thread nobody is joining
    // yet lets itself go instead of staying unjoined until then.
    std::lock_guard<std::mutex> lock(mThreadLock);
    if (mThread.joinable())
        mThread.detach();
}

// ---- sending -------------------------------------------------------------------

uint64_t Connection::exportObject_l(const sp<IBinder>& binder) {
    if (binder == mRoot)
        return kRootHandle;
    auto it = mExportIds.find(binder.get());
    uint64_t id;
    if (it != mExportIds.end()) {
        id = it->second;
    } else {
        id = mNextExportId++;
        mExportIds[binder.get()] = id;
        mExports[id] = Export{binder, 0};
    }
    ++mExports[id].refs;
    return id;
}

status_t Connection::flatten(uint32_t cmd, uint32_t flags, uint32_t codeOrStatus, uint64_t target,
                             uint64_t tid, const Parcel* parcel, Outgoing* out) {
    const size_t dataSize = parcel != nullptr ? parcel->dataSize() : 0;
    const size_t objects = parcel != nullptr ? parcel->mObjects.size() : 0;
    const size_t total = kHeaderBytes + dataSize + 4 * objects;
    if (total > kMaxFrameBytes) {
        TAVO_LOGE("%s: a parcel of %zu bytes is larger than a frame\n", __func__, dataSize);
        return FAILED_TRANSACTION;
    }
    out->bytes.assign(total, 0);
    uint8_t* h = out->bytes.data();
    putLe32(h, kMagic);
    putLe32(h + 4, cmd);
    putLe32(h + 8, flags);
    putLe32(h + 12, codeOrStatus);
    putLe64(h + 16, target);
    putLe64(h + 24, tid);
    putLe32(h + 32, static_cast<uint32_t>(dataSize));
    putLe32(h + 36, static_cast<uint32_t>(objects));
    if (dataSize == 0)
        return OK;
    uint8_t* data = h + kHeaderBytes;
    memcpy(data, parcel->data(), dataSize);
    uint8_t* offsets = data + dataSize;
    std::lock_guard<std::mutex> lock(mLock);
    for (size_t i = 0; i < objects; ++i) {
        const Parcel::Object& object = parcel->mObjects[i];
        uint8_t* flat = data + object.offset;
        uint32_t type = Parcel::OBJECT_BINDER;
        uint64_t handle = 0;
        if (object.type == Parcel::OBJECT_FD) {
            if (out->fds.size() >= kMaxFds)
                return FAILED_TRANSACTION;
            type = Parcel::OBJECT_FD;
            handle = out->fds.size();
            out->fds.push_back(object.fd);
        } else if (object.binder != nullptr) {
            BpBinder* proxy = object.binder->remoteBinder();
            if (proxy == nullptr) {
                handle = exportObject_l(object.binder);
            } else if (proxy->connection().get() == this) {
                type = Parcel::OBJECT_HANDLE;
                handle = proxy->handle();
            } else {
                // Passing a third process's object on would need a relay; not carried.
                TAVO_LOGE("%s: a proxy of another connection cannot be passed on\n", __func__);
                return INVALID_OPERATION;
            }
        }
        memset(flat, 0, Parcel::kFlatObjectBytes);
        putLe32(flat, type);
        putLe64(flat + 8, handle);
        putLe32(offsets + 4 * i, static_cast<uint32_t>(object.offset));
    }
    return OK;
}

status_t Connection::send(Outgoing&& frame) {
    std::lock_guard<std::mutex> lock(mSendLock);
    {
        std::lock_guard<std::mutex> stateLock(mLock);
        if (mDead || mHungUp)
            return DEAD_OBJECT;
    }
    if (mQueue.empty()) {
        iovec iov{frame.bytes.data(), frame.bytes.size()};
        msghdr msg{};
        msg.msg_iov = &iov;
        msg.msg_iovlen = 1;
        std::vector<uint8_t> control;
        if (!frame.fds.empty()) {
            control.assign(CMSG_SPACE(sizeof(int) * frame.fds.size()), 0);
            msg.msg_control = control.data();
            msg.msg_controllen = control.size();
            cmsghdr* cmsg = CMSG_FIRSTHDR(&msg);
            cmsg->cmsg_level = SOL_SOCKET;
            cmsg->cmsg_type = SCM_RIGHTS;
            cmsg->cmsg_len = CMSG_LEN(sizeof(int) * frame.fds.size());
            memcpy(CMSG_DATA(cmsg), frame.fds.data(), sizeof(int) * frame.fds.size());
        }
        const ssize_t n = sendmsg(mFd, &msg, MSG_DONTWAIT | MSG_NOSIGNAL);
        if (n >= 0) {
            mOverflowLogged = false;
            return OK;
        }
        if (errno == EMSGSIZE)
            return FAILED_TRANSACTION;
        if (errno != EAGAIN && errno != EWOULDBLOCK)
            return DEAD_OBJECT;
    }
    if (frame.oneway && (mQueuedOneway >= kMaxQueuedOneway ||
                         mQueuedBytes + frame.bytes.size() > kMaxQueuedBytes)) {
        if (!mOverflowLogged) {
            TAVO_LOGW("%s: peer pid %d is not reading; one-way calls dropped\n", __func__,
                      static_cast<int>(mPeerPid));
            mOverflowLogged = true;
        }
        return WOULD_BLOCK;
    }
    if (mQueuedBytes + frame.bytes.size() > kHardQueuedBytes) {
        TAVO_LOGE("%s: peer pid %d stopped reading; hanging up\n", __func__,
                  static_cast<int>(mPeerPid));
        shutdown(mFd, SHUT_RDWR);
        return DEAD_OBJECT;
    }
    // The caller's descriptors are only borrowed for the call; a queued frame keeps
    // its own copies until it is sent.
    for (int& fd : frame.fds) {
        fd = fcntl(fd, F_DUPFD_CLOEXEC, 0);
        if (fd < 0) {
            closeAll(frame.fds);
            return NO_MEMORY;
        }
    }
    mQueuedBytes += frame.bytes.size();
    if (frame.oneway)
        ++mQueuedOneway;
    mQueue.push_back(std::move(frame));
    wake();
    return OK;
}

status_t Connection::transact(uint64_t handle, uint32_t code, const Parcel& data, Parcel* reply,
                              uint32_t flags) {
    const bool oneway = (flags & IBinder::FLAG_ONEWAY) != 0;
    Pending pending;
    Parcel scratch;
    pending.reply = reply != nullptr ? reply : &scratch;
    uint64_t tid = 0;
    if (!oneway) {
        std::lock_guard<std::mutex> lock(mLock);
        if (mDead)
            return DEAD_OBJECT;
        tid = mNextTid++;
        mPending[tid] = &pending;
    }
    Outgoing frame;
    frame.oneway = oneway;
    status_t err =
        flatten(CMD_TRANSACTION, flags & IBinder::FLAG_ONEWAY, code, handle, tid, &data, &frame);
    if (err == OK)
        err = send(std::move(frame));
    std::unique_lock<std::mutex> lock(mLock);
    if (oneway || err != OK) {
        if (!oneway)
            mPending.erase(tid);
        return err;
    }
    while (!pending.done) {
        if (mDead) {
            mPending.erase(tid);
            return DEAD_OBJECT;
        }
        pending.cv.wait_for(lock, kReplyWaitStep);
    }
    return pending.status;
}

// ---- receiving -----------------------------------------------------------------

sp<IBinder> Connection::proxyFor_l(uint64_t handle) {
    sp<BpBinder> proxy;
    auto it = mProxies.find(handle);
    if (it != mProxies.end())
        proxy = it->second.weak.promote();
    if (proxy == nullptr) {
        proxy = new BpBinder(this, handle);
        mProxies[handle] = ProxyEntry{proxy.get(), proxy};
    }
    proxy->addRemoteRef();
    return proxy;
}

status_t Connection::unflatten(const uint8_t* data, size_t dataSize, const uint8_t* offsets,
                               size_t objectCount, std::vector<int>& fds, Parcel* out) {
    out->setData(data, dataSize);
    std::vector<bool> fdUsed(fds.size(), false);
    // On failure the parcel keeps (and closes) what it adopted; the caller closes the rest.
    auto fail = [&](status_t err) {
        for (size_t i = 0; i < fds.size(); ++i) {
            if (fdUsed[i])
                fds[i] = -1;
        }
        return err;
    };
    size_t next = 0;
    {
        std::lock_guard<std::mutex> lock(mLock);
        for (size_t i = 0; i < objectCount; ++i) {
            const size_t offset = getLe32(offsets + 4 * i);
            if (offset % 4 != 0 || offset < next || offset > dataSize ||
                dataSize - offset < Parcel::kFlatObjectBytes)
                return fail(BAD_VALUE);
            next = offset + Parcel::kFlatObjectBytes;
            const uint32_t type = getLe32(data + offset);
            const uint64_t handle = getLe64(data + offset + 8);
            sp<IBinder> binder;
            int fd = -1;
            if (type == Parcel::OBJECT_BINDER) {
                if (handle != 0)
                    binder = proxyFor_l(handle);
            } else if (type == Parcel::OBJECT_HANDLE) {
                if (handle == kRootHandle && mRoot != nullptr) {
                    binder = mRoot;
                } else {
                    auto it = mExports.find(handle);
                    if (it == mExports.end())
                        return fail(BAD_VALUE);
                    binder = it->second.binder;
                }
            } else if (type == Parcel::OBJECT_FD) {
                if (handle >= fds.size())
                    return fail(BAD_VALUE);
                fd = fdUsed[handle] ? fcntl(fds[handle], F_DUPFD_CLOEXEC, 0) : fds[handle];
                if (fd < 0)
                    return fail(NO_MEMORY);
                fdUsed[handle] = true;
            } else {
                return fail(BAD_TYPE);
            }
            out->adoptObject(offset, type, std::move(binder), fd);
        }
    }
    // Descriptors that no object names are not the receiver's to keep.
    for (size_t i = 0; i < fds.size(); ++i) {
        if (!fdUsed[i])
            close(fds[i]);
    }
    fds.clear();
    return OK;
}

bool Connection::handleFrame(const uint8_t* frame, size_t len, std::vector<int>& fds) {
    if (len < kHeaderBytes || getLe32(frame) != kMagic)
        return false;
    const uint32_t cmd = getLe32(frame + 4);
    const uint32_t flags = getLe32(frame + 8);
    const uint32_t codeOrStatus = getLe32(frame + 12);
    const uint64_t target = getLe64(frame + 16);
    const uint64_t tid = getLe64(frame + 24);
    const size_t dataSize = getLe32(frame + 32);
    const size_t objects = getLe32(frame + 36);
    if (dataSize > len - kHeaderBytes || objects > (len - kHeaderBytes - dataSize) / 4 ||
        kHeaderBytes + dataSize + 4 * objects != len)
        return false;
    const uint8_t* data = frame + kHeaderBytes;

    if (cmd == CMD_RELEASE) {
        sp<IBinder> dropped;  // released outside the lock: its destructor may call back
        std::lock_guard<std::mutex> lock(mLock);
        auto it = mExports.find(target);
        if (it != mExports.end()) {
            it->second.refs -= std::min<uint64_t>(it->second.refs, codeOrStatus);
            if (it->second.refs == 0) {
                dropped = std::move(it->second.binder);
                mExportIds.erase(dropped.get());
                mExports.erase(it);
            }
        }
        maybeHangUpIdle_l();
        return true;
    }
    if (cmd == CMD_REPLY) {
        auto parcel = std::make_unique<Parcel>();
        if (unflatten(data, dataSize, data + dataSize, objects, fds, parcel.get()) != OK)
            return false;
        std::lock_guard<std::mutex> lock(mLock);
        auto it = mPending.find(tid);
        if (it == mPending.end())
            return true;  // the caller gave up (its connection is going)
        Pending* pending = it->second;
        mPending.erase(it);
        // The data moves into the caller's parcel here; the caller is blocked on us.
        pending->reply->freeData();
        pending->reply->mData = std::move(parcel->mData);
        pending->reply->mObjects = std::move(parcel->mObjects);
        pending->reply->mPos = 0;
        parcel->mData.clear();
        parcel->mObjects.clear();
        pending->status = static_cast<status_t>(codeOrStatus);
        pending->done = true;
        pending->cv.notify_all();
        return true;
    }
    if (cmd != CMD_TRANSACTION)
        return false;

    auto incoming = std::make_unique<Incoming>();
    incoming->code = codeOrStatus;
    incoming->flags = flags;
    incoming->tid = tid;
    if (unflatten(data, dataSize, data + dataSize, objects, fds, &incoming->data) != OK)
        return false;
    {
        std::lock_guard<std::mutex> lock(mLock);
        if (target == kRootHandle && mRoot != nullptr) {
            incoming->target = mRoot;
        } else {
            auto it = mExports.find(target);
            if (it != mExports.end())
                incoming->target = it->second.binder;
        }
    }
    dispatch(std::move(incoming));
    return true;
}

void Connection::dispatch(std::unique_ptr<Incoming> incoming) {
    sp<Connection> self(this);
    if ((incoming->flags & IBinder::FLAG_ONEWAY) != 0) {
        std::lock_guard<std::mutex> lock(mLock);
        mOneway.push_back(std::move(incoming));
        if (mOnewayRunning)
            return;
        mOnewayRunning = true;
        ProcessState::self()->post([self] { self->drainOneway(); });
        return;
    }
    std::shared_ptr<Incoming> call(std::move(incoming));
    ProcessState::self()->post([self, call] { self->execute(*call); });
}

void Connection::drainOneway() {
    for (;;) {
        std::unique_ptr<Incoming> incoming;
        {
            std::lock_guard<std::mutex> lock(mLock);
            if (mOneway.empty()) {
                mOnewayRunning = false;
                break;
            }
            incoming = std::move(mOneway.front());
            mOneway.pop_front();
            // Reading pauses while the backlog is full; room again, so wake it.
            if (mOneway.size() + 1 == kMaxPendingIncoming)
                wake();
        }
        execute(*incoming);
    }
}

void Connection::execute(Incoming& incoming) {
    Parcel reply;
    status_t status = DEAD_OBJECT;
    if (incoming.target != nullptr) {
        IPCThreadState* ipc = IPCThreadState::self();
        const int64_t token = ipc->setCallingIdentity(mPeerPid, mPeerUid);
        incoming.data.setDataPosition(0);
        status = incoming.target->transact(incoming.code, incoming.data, &reply, incoming.flags);
        ipc->restoreCallingIdentity(token);
    }
    if ((incoming.flags & IBinder::FLAG_ONEWAY) != 0)
        return;
    Outgoing frame;
    frame.oneway = false;
    status_t err = flatten(CMD_REPLY, 0, static_cast<uint32_t>(status), 0, incoming.tid,
                           status == OK ? &reply : nullptr, &frame);
    if (err != OK)
        err = flatten(CMD_REPLY, 0, static_cast<uint32_t>(err), 0, incoming.tid, nullptr, &frame);
    if (err == OK)
        send(std::move(frame));
}

bool Connection::flushQueue() {
    std::lock_guard<std::mutex> lock(mSendLock);
    while (!mQueue.empty()) {
        Outgoing& frame = mQueue.front();
        iovec iov{frame.bytes.data(), frame.bytes.size()};
        msghdr msg{};
        msg.msg_iov = &iov;
        msg.msg_iovlen = 1;
        std::vector<uint8_t> control;
        if (!frame.fds.empty()) {
            control.assign(CMSG_SPACE(sizeof(int) * frame.fds.size()), 0);
            msg.msg_control = control.data();
            msg.msg_controllen = control.size();
            cmsghdr* cmsg = CMSG_FIRSTHDR(&msg);
            cmsg->cmsg_level = SOL_SOCKET;
            cmsg->cmsg_type = SCM_RIGHTS;
            cmsg->cmsg_len = CMSG_LEN(sizeof(int) * frame.fds.size());
            memcpy(CMSG_DATA(cmsg), frame.fds.data(), sizeof(int) * frame.fds.size());
        }
        if (sendmsg(mFd, &msg, MSG_DONTWAIT | MSG_NOSIGNAL) < 0) {
            if (errno == EAGAIN || errno == EWOULDBLOCK)
                return true;
            return false;
        }
        mQueuedBytes -= frame.bytes.size();
        if (frame.oneway)
            --mQueuedOneway;
        closeAll(frame.fds);
        mQueue.pop_front();
    }
    mOverflowLogged = false;
    return true;
}

bool Connection::readFrames() {
    // Allocated once: zeroing a frame-sized buffer on every wake-up would cost more
    // than a small transaction itself.
    if (mRecvBuffer.empty()) {
        mRecvBuffer.resize(kMaxFrameBytes);
        mRecvControl.resize(CMSG_SPACE(sizeof(int) * kMaxFds));
    }
    std::vector<uint8_t>& buffer = mRecvBuffer;
    std::vector<uint8_t>& control = mRecvControl;
    for (int batch = 0; batch < 64; ++batch) {
        {
            std::lock_guard<std::mutex> lock(mLock);
            if (mOneway.size() >= kMaxPendingIncoming)
                return true;
        }
        iovec iov{buffer.data(), buffer.size()};
        msghdr msg{};
        msg.msg_iov = &iov;
        msg.msg_iovlen = 1;
        msg.msg_control = control.data();
        msg.msg_controllen = control.size();
        const ssize_t n = recvmsg(mFd, &msg, MSG_DONTWAIT | MSG_CMSG_CLOEXEC);
        if (n < 0)
            return errno == EAGAIN || errno == EWOULDBLOCK || errno == EINTR;
        std::vector<int> fds;
        for (cmsghdr* c = CMSG_FIRSTHDR(&msg); c != nullptr; c = CMSG_NXTHDR(&msg, c)) {
            if (c->cmsg_level == SOL_SOCKET && c->cmsg_type == SCM_RIGHTS) {
                const size_t count = (c->cmsg_len - CMSG_LEN(0)) / sizeof(int);
                const size_t at = fds.size();
                fds.resize(at + count);
                memcpy(fds.data() + at, CMSG_DATA(c), count * sizeof(int));
            }
        }
        if (n == 0) {
            closeAll(fds);
            return false;  // the peer hung up
        }
        const bool truncated = (msg.msg_flags & (MSG_TRUNC | MSG_CTRUNC)) != 0;
        if (truncated || !handleFrame(buffer.data(), static_cast<size_t>(n), fds)) {
            TAVO_LOGE("%s: malformed frame from pid %d; hanging up\n", __func__,
                      static_cast<int>(mPeerPid));
            closeAll(fds);
            return false;
        }
        closeAll(fds);
    }
    return true;
}

void Connection::ioLoop() {
    for (;;) {
        bool wantOut;
        bool wantIn;
        {
            std::lock_guard<std::mutex> lock(mSendLock);
            wantOut = !mQueue.empty();
        }
        {
            std::lock_guard<std::mutex> lock(mLock);
            if (mHungUp)
                break;
            wantIn = mOneway.size() < kMaxPendingIncoming;
        }
        pollfd fds[2] = {
            {mFd, static_cast<short>((wantIn ? POLLIN : 0) | (wantOut ? POLLOUT : 0)), 0},
            {mWakeFd, POLLIN, 0}};
        const int n = poll(fds, 2, kPollMs);
        if (n < 0 && errno != EINTR)
            break;
        if (n <= 0)
            continue;
        if (fds[1].revents & POLLIN) {
            uint64_t value;
            [[maybe_unused]] ssize_t r = ::read(mWakeFd, &value, sizeof value);
        }
        if ((fds[0].revents & POLLOUT) && !flushQueue())
            break;
        if ((fds[0].revents & POLLIN) && !readFrames())
            break;
        if ((fds[0].revents & (POLLERR | POLLNVAL)) ||
            ((fds[0].revents & POLLHUP) && !(fds[0].revents & POLLIN)))
            break;
    }
    die();
}

void Connection::die() {
    std::vector<sp<BpBinder>> proxies;
    std::map<uint64_t, Export> exports;
    {
        std::lock_guard<std::mutex> lock(mLock);
        mDead = true;
        for (auto& [tid, pending] : mPending) {
            pending->status = DEAD_OBJECT;
            pending->done = true;
            pending->cv.notify_all();
        }
        mPending.clear();
        for (auto& [handle, entry] : mProxies) {
            sp<BpBinder> proxy = entry.weak.promote();
            if (proxy != nullptr)
                proxies.push_back(proxy);
        }
        exports.swap(mExports);
        mExportIds.clear();
    }
    shutdown(mFd, SHUT_RDWR);
    exports.clear();  // the peer's references to our objects went with it
    if (!proxies.empty()) {
        ProcessState::self()->post([proxies] {
            for (const sp<BpBinder>& proxy : proxies)
                proxy->sendObituary();
        });
    }
    proxies.clear();
    ProcessState::self()->removeConnection(this);
}

void Connection::maybeHangUpIdle_l() {
    if (!mOutgoing || mDead || mHungUp || !mExports.empty() || !mProxies.empty())
        return;
    mHungUp = true;
    shutdown(mFd, SHUT_RDWR);
    wake();
}

void Connection::proxyDestroyed(uint64_t handle, BpBinder* proxy, uint32_t remoteRefs) {
    {
        std::lock_guard<std::mutex> lock(mLock);
        auto it = mProxies.find(handle);
        if (it != mProxies.end() && it->second.raw == proxy)
            mProxies.erase(it);
        if (mDead)
            return;
        if (remoteRefs == 0) {
            maybeHangUpIdle_l();
            return;
        }
    }
    Outgoing frame;
    frame.oneway = false;  // a release is never dropped
    if (flatten(CMD_RELEASE, 0, remoteRefs, handle, 0, nullptr, &frame) == OK)
        send(std::move(frame));
    std::lock_guard<std::mutex> lock(mLock);
    maybeHangUpIdle_l();
}

}  // namespace android
