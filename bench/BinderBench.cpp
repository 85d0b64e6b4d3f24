// The binder transport over AF_UNIX SOCK_SEQPACKET, next to the bare socket doing
// the same exchange in the same run:
//  - round trip: a two-way transaction with a small parcel (token, an integer, a
//    short 16-bit string) answered with an integer, against a 64-byte message
//    echoed by a thread on a socket pair;
//  - one-way rate: one-way transactions (token and an integer) taken by a service
//    object, against 64-byte messages read by a thread.
// The binder side runs through the whole stack: parcels, frames, the I/O thread,
// the binder thread pool and the calling-identity switch. Ratios are printed after
// the table (the socket's cost over ours: above 1 would mean binder is cheaper).
#include <benchmark/benchmark.h>
#include <sys/socket.h>
#include <unistd.h>

#include <atomic>
#include <cstdio>
#include <map>
#include <string>
#include <thread>

#include "platform/binder/BBinder.h"
#include "platform/binder/Connection.h"
#include "platform/binder/Parcel.h"
#include "platform/os/Trace.h"

namespace {

using android::Parcel;
using android::sp;

constexpr size_t kMessageBytes = 64;
const android::String16 kToken("TavoPlayer");

class Counter : public android::BBinder {
public:
    std::atomic<int64_t> received{0};

protected:
    android::status_t onTransact(uint32_t code, const Parcel& data, Parcel* reply,
                                 uint32_t flags) override {
        if (!data.enforceInterface(kToken))
            return -1;
        const int32_t value = data.readInt32();
        if (code == 1 && reply != nullptr) {
            reply->writeInt32(value + 1);
        } else if (code == 2) {
            received.fetch_add(1, std::memory_order_release);
        } else {
            return BBinder::onTransact(code, data, reply, flags);
        }
        return android::OK;
    }
};

// A service object on one end of a socket pair and a proxy for it on the other.
struct BinderPair {
    BinderPair() {
        int fds[2];
        socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0, fds);
        server = android::Connection::create(fds[0], service);
        client = android::Connection::create(fds[1], nullptr);
        server->start();
        client->start();
        proxy = client->rootProxy();
    }
    ~BinderPair() {
        proxy.clear();
        server->hangUp();
        client->hangUp();
        server->join();
        client->join();
    }
    sp<Counter> service = new Counter();
    sp<android::Connection> server;
    sp<android::Connection> client;
    sp<android::IBinder> proxy;
};

void BM_BinderRoundTrip(benchmark::State& state) {
    BinderPair pair;
    const android::String16 text("MTV://bench");
    int32_t value = 0;
    for (auto _ : state) {
        Parcel data, reply;
        data.writeInterfaceToken(kToken);
        data.writeInt32(value);
        data.writeString16(text);
        if (pair.proxy->transact(1, data, &reply) != android::OK) {
            state.SkipWithError("transaction failed");
            break;
        }
        value = reply.readInt32();
    }
    benchmark::DoNotOptimize(value);
}

void BM_SocketPingPong(benchmark::State& state) {
    int fds[2];
    socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0, fds);
    std::thread echo([fd = fds[1]] {
        char buffer[kMessageBytes];
        ssize_t n;
        while ((n = recv(fd, buffer, sizeof buffer, 0)) > 0)
            send(fd, buffer, static_cast<size_t>(n), MSG_NOSIGNAL);
    });
    char message[kMessageBytes] = {};
    for (auto _ : state) {
        send(fds[0], message, sizeof message, MSG_NOSIGNAL);
        recv(fds[0], message, sizeof message, 0);
    }
    shutdown(fds[0], SHUT_RDWR);
    echo.join();
    close(fds[0]);
    close(fds[1]);
}

void BM_BinderOneway(benchmark::State& state) {
    BinderPair pair;
    int64_t sent = 0;
    for (auto _ : state) {
        Parcel data;
        data.writeInterfaceToken(kToken);
        data.writeInt32(static_cast<int32_t>(sent));
        // The bounded queue refuses when the receiver lags; the rate is what gets through.
        while (pair.proxy->transact(2, data, nullptr, android::IBinder::FLAG_ONEWAY) ==
               android::WOULD_BLOCK)
            std::this_thread::yield();
        ++sent;
    }
    while (pair.service->received.load(std::memory_order_acquire) < sent)
        std::this_thread::yield();
    state.SetItemsProcessed(sent);
}

void BM_SocketOneway(benchmark::State& state) {
    int fds[2];
    socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0, fds);
    std::atomic<int64_t> received{0};
    std::thread reader([fd = fds[1], &received] {
        char buffer[kMessageBytes];
        while (recv(fd, buffer, sizeof buffer, 0) > 0)
            received.fetch_add(1, std::memory_order_release);
    });
    char message[kMessageBytes] = {};
    int64_t sent = 0;
    for (auto _ : state) {
        send(fds[0], message, sizeof message, MSG_NOSIGNAL);
        ++sent;
    }
    while (received.load(std::memory_order_acquire) < sent)
        std::this_thread::yield();
    shutdown(fds[0], SHUT_RDWR);
    reader.join();
    close(fds[0]);
    close(fds[1]);
    state.SetItemsProcessed(sent);
}

BENCHMARK(BM_BinderRoundTrip)->Unit(benchmark::kMicrosecond)->UseRealTime();
BENCHMARK(BM_SocketPingPong)->Unit(benchmark::kMicrosecond)->UseRealTime();
BENCHMARK(BM_BinderOneway)->Unit(benchmark::kMicrosecond)->UseRealTime();
BENCHMARK(BM_SocketOneway)->Unit(benchmark::kMicrosecond)->UseRealTime();

// Keeps each run's time per iteration and rate to print the ratios after the table.
class RatioReporter : public benchmark::ConsoleReporter {
public:
    void ReportRuns(const std::vector<Run>& runs) override {
        for (const Run& run : runs) {
            if (run.run_type != Run::RT_Iteration)
                continue;
            mSecondsPerIteration[run.benchmark_name()] =
                run.GetAdjustedRealTime() / benchmark::GetTimeUnitMultiplier(run.time_unit);
            const auto it = run.counters.find("items_per_second");
            if (it != run.counters.end())
                mRate[run.benchmark_name()] = it->second.value;
        }
        ConsoleReporter::ReportRuns(runs);
    }
    void printRatios() const {
        const auto binder = mSecondsPerIteration.find("BM_BinderRoundTrip/real_time");
        const auto socket = mSecondsPerIteration.find("BM_SocketPingPong/real_time");
        if (binder != mSecondsPerIteration.end() && socket != mSecondsPerIteration.end()) {
            std::printf("round trip: binder %.1f us, socket ping-pong %.1f us, ratio %.2f\n",
                        binder->second * 1e6, socket->second * 1e6,
                        socket->second / binder->second);
        }
        const auto oneway = mRate.find("BM_BinderOneway/real_time");
        const auto plain = mRate.find("BM_SocketOneway/real_time");
        if (oneway != mRate.end() && plain != mRate.end()) {
            std::printf("one-way: binder %.0f calls/s, socket %.0f messages/s, ratio %.2f\n",
                        oneway->second, plain->second, oneway->second / plain->second);
        }
    }

private:
    std::map<std::string, double> mSecondsPerIteration;
    std::map<std::string, double> mRate;
};

}  // namespace

int main(int argc, char** argv) {
    setenv("TAVOPLAYER_LOG_LEVEL", "error", 0);
    benchmark::Initialize(&argc, argv);
    RatioReporter reporter;
    benchmark::RunSpecifiedBenchmarks(&reporter);
    reporter.printRatios();
    benchmark::Shutdown();
    return 0;
}
