#include "platform/binder/SocketServiceManager.h"

#include <poll.h>
#include <pthread.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <cstdlib>
#include <cstring>
#include <filesystem>

#include "platform/binder/Connection.h"
#include "platform/os/Trace.h"

namespace android {

namespace {

constexpr int kAcceptPollMs = 100;
constexpr auto kGetServiceWait = std::chrono::seconds(5);
constexpr auto kGetServiceStep = std::chrono::milliseconds(100);
constexpr int kListenBacklog = 16;

std::string toUtf8(const String16& name) {
    return std::string(String8(name).string());
}

// A name becomes a file name: no separators, no dot files.
bool validName(const std::string& name) {
    return !name.empty() && name[0] != '.' && name.find('/') == std::string::npos &&
           name.find('\0') == std::string::npos;
}

status_t makeDirectory(const std::string& dir) {
    std::error_code ec;
    std::filesystem::create_directories(dir, ec);
    struct stat st {};
    if (stat(dir.c_str(), &st) != 0 || !S_ISDIR(st.st_mode)) {
        TAVO_LOGE("%s: cannot create the service directory %s: %s\n", "addService", dir.c_str(),
                  ec ? ec.message().c_str() : "not a directory");
        return PERMISSION_DENIED;
    }
    return OK;
}

}  // namespace

sp<IServiceManager> defaultServiceManager() {
    return SocketServiceManager::self();
}

sp<SocketServiceManager> SocketServiceManager::self() {
    // Never destroyed: listener threads may run while the process exits.
    static SocketServiceManager* const gManager = [] {
        auto* manager = new SocketServiceManager();
        manager->incStrong(nullptr);
        return manager;
    }();
    return gManager;
}

std::string SocketServiceManager::serviceDirectory() {
    const char* dir = getenv("TAVOPLAYER_SERVICE_DIR");
    if (dir != nullptr && dir[0] != '\0')
        return dir;
    if (geteuid() == 0)
        return "/run/tavoplayer";
    const char* runtime = getenv("XDG_RUNTIME_DIR");
    if (runtime != nullptr && runtime[0] != '\0')
        return std::string(runtime) + "/tavoplayer";
    return "/tmp/tavoplayer-" + std::to_string(getuid());
}

sp<IBinder> SocketServiceManager::checkService(const String16& name16) const {
    const std::string name = toUtf8(name16);
    if (!validName(name))
        return nullptr;
    {
        std::lock_guard<std::mutex> lock(mLock);
        auto it = mListeners.find(name);
        if (it != mListeners.end())
            return it->second->service;
    }
    const std::string path = serviceDirectory() + "/" + name;
    sp<Connection> connection = Connection::connect(path.c_str());
    return connection != nullptr ? connection->rootProxy() : nullptr;
}

sp<IBinder> SocketServiceManager::getService(const String16& name) const {
    const auto deadline = std::chrono::steady_clock::now() + kGetServiceWait;
    for (;;) {
        sp<IBinder> service = checkService(name);
        if (service != nullptr || std::chrono::steady_clock::now() >= deadline)
            return service;
        std::this_thread::sleep_for(kGetServiceStep);
    }
}

status_t SocketServiceManager::addService(const String16& name16, const sp<IBinder>& service,
                                          bool /*allowIsolated*/, int /*dumpsysPriority*/) {
    const std::string name = toUtf8(name16);
    if (!validName(name) || service == nullptr || service->localBinder() == nullptr)
        return BAD_VALUE;
    const std::string dir = serviceDirectory();
    status_t err = makeDirectory(dir);
    if (err != OK)
        return err;
    auto listener = std::make_unique<Listener>();
    listener->path = dir + "/" + name;
    listener->service = service;
    sockaddr_un addr{};
    addr.sun_family = AF_UNIX;
    if (listener->path.size() >= sizeof addr.sun_path) {
        TAVO_LOGE("%s: socket path too long: %s\n", __func__, listener->path.c_str());
        return BAD_VALUE;
    }
    strcpy(addr.sun_path, listener->path.c_str());

    std::lock_guard<std::mutex> lock(mLock);
    if (mListeners.count(name) != 0)
        return ALREADY_EXISTS;
    // A socket file whose owner still answers is a live service of another process;
    // one that refuses is left over from a process that died, and is replaced.
    sp<Connection> probe = Connection::connect(listener->path.c_str());
    if (probe != nullptr) {
        probe->hangUp();
        TAVO_LOGE("%s: %s is already served by another process\n", __func__, name.c_str());
        return ALREADY_EXISTS;
    }
    unlink(listener->path.c_str());
    listener->fd = socket(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0);
    if (listener->fd < 0)
        return -errno;
    if (bind(listener->fd, reinterpret_cast<sockaddr*>(&addr), sizeof addr) != 0 ||
        listen(listener->fd, kListenBacklog) != 0) {
        err = -errno;
        TAVO_LOGE("%s: cannot listen on %s: %s\n", __func__, listener->path.c_str(),
                  strerror(errno));
        close(listener->fd);
        return err;
    }
    // Any local user may call; what a caller may do is decided by its uid (SO_PEERCRED).
    chmod(listener->path.c_str(), 0666);
    Listener* raw = listener.get();
    listener->thread = std::thread([raw] { acceptLoop(raw); });
    mListeners[name] = std::move(listener);
    return OK;
}

void SocketServiceManager::acceptLoop(Listener* listener) {
    pthread_setname_np(pthread_self(), "BinderListen");
    while (!listener->stop.load()) {
        pollfd pfd{listener->fd, POLLIN, 0};
        if (poll(&pfd, 1, kAcceptPollMs) <= 0)
            continue;
        const int fd = accept4(listener->fd, nullptr, nullptr, SOCK_CLOEXEC);
        if (fd < 0)
            continue;
        // On failure the connection has already closed the socket.
        sp<Connection> connection = Connection::create(fd, listener->service);
        if (connection != nullptr)
            connection->start();
    }
}

Vector<String16> SocketServiceManager::listServices(int /*dumpsysPriority*/) {
    Vector<String16> names;
    std::error_code ec;
    for (const auto& entry : std::filesystem::directory_iterator(serviceDirectory(), ec)) {
        if (entry.is_socket(ec))
            names.add(String16(entry.path().filename().c_str()));
    }
    return names;
}

void SocketServiceManager::stopServing() {
    std::map<std::string, std::unique_ptr<Listener>> listeners;
    {
        std::lock_guard<std::mutex> lock(mLock);
        listeners.swap(mListeners);
    }
    for (auto& [name, listener] : listeners) {
        listener->stop.store(true);
        listener->thread.join();
        close(listener->fd);
        unlink(listener->path.c_str());
    }
}

}  // namespace android
