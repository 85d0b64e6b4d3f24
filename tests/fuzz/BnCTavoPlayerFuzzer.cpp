// BnCTavoPlayer::onTransact on arbitrary requests: the first four bytes choose the
// transaction code (little-endian; folded onto 0..31 so that every code and the
// gaps are reached, unless it is one of the platform's own '_'-codes), the rest is
// the request parcel. The service behind it only
// counts calls. A request must never crash the stub nor read outside the parcel
// (the parcel's buffer is exactly the input's size, for the sanitizers), and a
// request without the right token must reach no operation.
#include <cstdint>
#include <cstdlib>
#include <cstring>

#include "QuietFuzzInitialize.h"
#include "platform/binder/Parcel.h"
#include "service/BnCTavoPlayer.h"

namespace {

using android::sp;

class CountingService : public TavoPlayer::BnCTavoPlayer {
public:
    int calls = 0;
    uint32_t registerClient(const sp<TavoPlayer::ICTavoPlayerClient>&) override { return hit(); }
    uint32_t start() override { return hit(); }
    uint32_t stop() override { return hit(); }
    uint32_t getState() override { return hit(); }
    uint32_t pause() override { return hit(); }
    uint32_t resume() override { return hit(); }
    uint32_t seek(int32_t) override { return hit(); }
    uint32_t openUri(const char* uri, int32_t) override { return uri != nullptr ? hit() : 1; }
    uint32_t close() override { return hit(); }
    uint32_t setSurface(const sp<android::Surface>&) override { return hit(); }
    uint32_t getFrame(int32_t, int32_t) override { return hit(); }
    uint32_t setSoundEffect(int32_t, int32_t) override { return hit(); }
    uint32_t startRecorder(const char* uri) override { return uri != nullptr ? hit() : 1; }
    uint32_t stopRecorder(int32_t) override { return hit(); }
    uint32_t setAVSync(int32_t) override { return hit(); }
    uint32_t setCaptionSync(int32_t) override { return hit(); }
    uint32_t setAudioEnable(int32_t) override { return hit(); }
    uint32_t setCaptionLanguage(int32_t) override { return hit(); }
    uint32_t setAudioPID(int32_t) override { return hit(); }
    int32_t setAudioPathForce(int32_t) override { return static_cast<int32_t>(hit()); }
    uint32_t setCCPID(int32_t) override { return hit(); }
    int32_t getFrameRate() override { return static_cast<int32_t>(hit()); }
    uint32_t setCropRect(int32_t, int32_t, int32_t, int32_t, int32_t) override { return hit(); }
    uint32_t setAudioOnlyMode(int32_t) override { return hit(); }
    int64_t getPCRValue() override { return hit(); }

private:
    uint32_t hit() { return static_cast<uint32_t>(++calls); }
};

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    if (size < 4 || size > (1u << 16))
        return 0;
    uint32_t code;
    memcpy(&code, data, 4);
    const bool platformCode = (code >> 24) == '_';
    if (!platformCode)
        code %= 32;
    android::Parcel request;
    request.setData(data + 4, size - 4);
    android::Parcel reply;
    sp<CountingService> service = new CountingService();
    const android::status_t status = service->transact(code, request, &reply);
    // Only a request that passed the token check may reach the service, and then
    // with success as the transaction status.
    if (service->calls > 1 || (service->calls == 1 && status != android::OK))
        abort();
    if (status == -1 && service->calls != 0)
        abort();
    if (!platformCode && reply.dataSize() > 8)
        abort();
    return 0;
}
