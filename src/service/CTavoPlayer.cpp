#include "service/CTavoPlayer.h"

#include <sys/syscall.h>
#include <unistd.h>

#include <cstdio>
#include <memory>

#include <utils/String8.h>

#include "common/Module.h"
#include "common/Uri.h"
#include "platform/audio/AudioSystem.h"
#include "platform/binder/IPCThreadState.h"
#include "platform/binder/IServiceManager.h"
#include "platform/binder/PermissionCache.h"
#include "platform/os/Trace.h"
#include "service/MP4Controller.h"
#include "service/MainController.h"

namespace TavoPlayer {

android::sp<CTavoPlayer> CTavoPlayer::m_pSelf;

namespace {

// Open type 5 is a broadcast or stream URI for the pipeline, 0 a media file for
// the platform media player.
constexpr int32_t kOpenTypePipeline = 5;
constexpr int32_t kOpenTypeMediaPlayer = 0;
constexpr uint32_t kRecorderStartFailed = 0x60003;
constexpr uint32_t kDecoderFatal = 0x31004;

int currentTid() {
    return static_cast<int>(syscall(SYS_gettid));
}

// Ends the process at once: these errors are not recoverable in process, and the
// platform restarts the service while the client sees its binder die.
[[noreturn]] void commitSuicide() {
    std::fflush(nullptr);
    _exit(CTavoPlayer::kSuicideExitStatus);
}

}  // namespace

void CTavoPlayer::instantiate() {
    if (m_pSelf != nullptr) {
        TAVO_LOGW("%s: Service already instantiated", __func__);
        return;
    }
    m_pSelf = new CTavoPlayer();
    const android::status_t err = android::defaultServiceManager()->addService(
        android::String16("TavoPlayer"), m_pSelf, false,
        android::IServiceManager::DUMP_FLAG_PRIORITY_DEFAULT);
    if (err != android::OK) {
        // Nothing can reach a service that is not registered: say so and leave
        // self() null so that the host can report it and exit.
        TAVO_LOGE("%s: Error registering TavoPlayer service (%d)", __func__, err);
        m_pSelf.clear();
        return;
    }
    TAVO_LOGI("%s: TavoPlayer service started and registered", __func__);
}

android::sp<CTavoPlayer> CTavoPlayer::self() {
    return m_pSelf;
}

const char* CTavoPlayer::stateName(uint32_t state) {
    static const char* const kNames[] = {"None", "Closed", "Stopped", "Playing", "Paused"};
    return state < std::size(kNames) ? kNames[state] : "Unknown";
}

CTavoPlayer::CTavoPlayer()
    : mState(TAVOPLAYER_STATE_CLOSED),
      mSourceType(SOURCE_LIVE),
      mAudioEnable(true),
      mAudioOnlyMode(false),
      mSoundEffect(-1),
      mCaptionSync(0),
      mAVSync(0) {
    static std::once_flag traceOnce;
    std::call_once(traceOnce, [] { OneSegPGL_InitializeDebug(); });
}

CTavoPlayer::~CTavoPlayer() = default;

void CTavoPlayer::logClient(const char* func, const android::sp<ICTavoPlayerClient>& client,
                            bool warning) const {
    const int caller = static_cast<int>(android::IPCThreadState::self()->getCallingPid());
    if (warning)
        TAVO_LOGW("%s: client addr=[%p], tid=[%d], calling tid=[%d]", func, client.get(),
                  currentTid(), caller);
    else
        TAVO_LOGI("%s: client addr=[%p], tid=[%d], calling tid=[%d]", func, client.get(),
                  currentTid(), caller);
}

uint32_t CTavoPlayer::registerClient(const android::sp<ICTavoPlayerClient>& client) {
    std::lock_guard<std::mutex> lock(mLock);
    logClient(__func__, client, false);
    if (client == nullptr)
        return 0;
    android::sp<android::IBinder> binder = android::IInterface::asBinder(client);
    if (binder != mClientBinder) {
        // The previous client's binder is not unlinked: its death then only finds
        // that it is no longer the stored client.
        mClientBinder = binder;
        binder->linkToDeath(this);
        std::lock_guard<std::mutex> clientLock(mClientLock);
        mClient = client;
        TAVO_LOGI("%s: Adding notification client! binder [%p]", __func__, binder.get());
    }
    return 0;
}

void CTavoPlayer::binderDied(const android::wp<android::IBinder>& who) {
    logClient(__func__, currentClient(), true);
    setAudioPathForce(0);
    android::AudioSystem::setParameters(0, android::String8("audioParam;DMB_FORCE_SPEAKER=off"));
    android::sp<ControllerInterface> player;
    {
        std::lock_guard<std::mutex> lock(mLock);
        if (who.unsafe_get() == mClientBinder.get()) {
            mClientBinder.clear();
            std::lock_guard<std::mutex> clientLock(mClientLock);
            mClient.clear();
        }
        player = m_pPlayer;
    }
    if (player != nullptr) {
        MainController* main = dynamic_cast<MainController*>(player.get());
        if (main != nullptr)
            main->stopTSReceiver();
    }
    close();
}

uint32_t CTavoPlayer::openUri(const char* uri, int32_t type) {
    std::lock_guard<std::mutex> lock(mLock);
    TAVO_LOGI("%s: pUri: %s type: %d", __func__, uri != nullptr ? uri : "(null)", type);
    if (mState != TAVOPLAYER_STATE_CLOSED) {
        const uint32_t result = performClose_l();
        if (result != 0) {
            if (mClient != nullptr)
                mClient->openUriComplete(static_cast<int32_t>(result));
            return result;
        }
    }
    const uint32_t status = createController_l(uri, type);
    if (status != 0) {
        TAVO_LOGE("%s: Error configuring Controller: %d", __func__, static_cast<int>(status));
        m_pPlayer.clear();
        if (mClient != nullptr)
            mClient->openUriComplete(static_cast<int32_t>(status));
        return status;
    }
    if (mClient != nullptr)
        mClient->onBufferingBegin();
    mState = TAVOPLAYER_STATE_STOPPED;
    m_pPlayer->setCaptureFrameListener(this);
    m_pPlayer->setServiceControllerListener(this);
    m_pPlayer->setCaptionListener(this);
    m_pPlayer->setErrorListener(this);
    m_pPlayer->setAudioRenderedListener(this);
    m_pPlayer->setVideoRenderedListener(this);
    m_pPlayer->setPlayerListener(this);
    m_pPlayer->setRecorderListener(this);
    m_pPlayer->setAudioEnable(mAudioEnable ? 1 : 0);
    m_pPlayer->setSurface(mSurface);
    if (mSoundEffect != -1)
        m_pPlayer->setSoundEffect(mSoundEffect);
    m_pPlayer->setAVSync(mAVSync);
    if (mClient != nullptr)
        mClient->openUriComplete(0);
    return 0;
}

uint32_t CTavoPlayer::createController_l(const char* uri, int32_t type) {
    std::map<std::string, std::string> config;
    if (type == kOpenTypePipeline) {
        std::unique_ptr<Uri> parsed(Uri::parse(uri));
        if (parsed == nullptr) {
            TAVO_LOGE("%s: uri parsing error", "openUri");
            return 1;
        }
        if (parsed->mScheme == "MTV")
            mSourceType = SOURCE_LIVE;
        else if (parsed->mScheme == "FILE")
            mSourceType = SOURCE_CLIP;
        else
            TAVO_LOGE("%s: Unknown URI Scheme", "openUri");
        m_pPlayer = new MainController();
        config = parsed->mQueries;
        // emplace keeps a query item of the same name: the URI may override both.
        config.emplace("sourceType", std::to_string(mSourceType));
        if (parsed->mScheme == "FILE")
            config.emplace("filePath", parsed->mPath);
        return m_pPlayer->configure(config);
    }
    if (type == kOpenTypeMediaPlayer) {
        mSourceType = SOURCE_MEDIA_PLAYER;
        m_pPlayer = new MP4Controller();
        config["path"] = uri != nullptr ? uri : "";
        return m_pPlayer->configure(config);
    }
    TAVO_LOGE("%s: Source type is not supported: %d", "openUri", type);
    return 1;
}

uint32_t CTavoPlayer::start() {
    std::lock_guard<std::mutex> lock(mLock);
    uint32_t status = 1;
    if (mState == TAVOPLAYER_STATE_STOPPED && m_pPlayer != nullptr) {
        status = m_pPlayer->start();
        if (status == 0)
            mState = TAVOPLAYER_STATE_PLAYING;
        else
            TAVO_LOGE("%s: Error starting player", __func__);
    }
    if (mClient != nullptr)
        mClient->startComplete(static_cast<int32_t>(status));
    return 0;
}

uint32_t CTavoPlayer::stop() {
    std::lock_guard<std::mutex> lock(mLock);
    TAVO_LOGI("%s", __func__);
    return performStop_l();
}

uint32_t CTavoPlayer::performStop_l() {
    switch (mState) {
        case TAVOPLAYER_STATE_PLAYING:
        case TAVOPLAYER_STATE_PAUSED: {
            if (m_pPlayer == nullptr)
                return 0;
            const uint32_t status = m_pPlayer->stop();
            if (status != 0) {
                TAVO_LOGE("%s Error stopping player", "performStop");
                onError(1);
                return status;
            }
            mState = TAVOPLAYER_STATE_STOPPED;
            return 0;
        }
        case TAVOPLAYER_STATE_STOPPED:
            return 0;
        default:
            // Stopping a service that has no open source ends the process, as
            // designed: the client and the service disagree about the state.
            TAVO_LOGE("%s - end", "performStop");
            onError(1);
            return 1;
    }
}

uint32_t CTavoPlayer::close() {
    std::lock_guard<std::mutex> lock(mLock);
    return performClose_l();
}

uint32_t CTavoPlayer::performClose_l() {
    TAVO_LOGI("%s", "performClose");
    if (mState == TAVOPLAYER_STATE_PLAYING || mState == TAVOPLAYER_STATE_PAUSED) {
        const uint32_t status = performStop_l();
        if (status != 0)
            return status;
    }
    if (mState == TAVOPLAYER_STATE_CLOSED)
        return 0;
    if (mState == TAVOPLAYER_STATE_NONE) {
        TAVO_LOGE("%s - end", "performClose");
        onError(1);
        return 1;
    }
    if (m_pPlayer == nullptr)
        return 1;
    m_pPlayer.clear();
    mState = TAVOPLAYER_STATE_CLOSED;
    return 0;
}

uint32_t CTavoPlayer::getState() {
    return mState;
}

uint32_t CTavoPlayer::pause() {
    std::lock_guard<std::mutex> lock(mLock);
    // The client is called without a null check, as designed; a callback to no
    // client is only skipped here so that a command sent before registration
    // cannot bring the service down.
    if (mState != TAVOPLAYER_STATE_PLAYING) {
        TAVO_LOGE("%s mState != TAVOPLAYER_STATE_PLAY - end", __func__);
        if (mClient != nullptr)
            mClient->onPaused(1);
        return 1;
    }
    m_pPlayer->pause();
    mState = TAVOPLAYER_STATE_PAUSED;
    if (mClient != nullptr)
        mClient->onPaused(0);
    return 0;
}

uint32_t CTavoPlayer::resume() {
    std::lock_guard<std::mutex> lock(mLock);
    if (mState != TAVOPLAYER_STATE_PAUSED) {
        if (mClient != nullptr)
            mClient->onResumed(1);
        return 1;
    }
    m_pPlayer->resume();
    mState = TAVOPLAYER_STATE_PLAYING;
    if (mClient != nullptr)
        mClient->onResumed(0);
    return 0;
}

uint32_t CTavoPlayer::seek(int32_t ms) {
    std::lock_guard<std::mutex> lock(mLock);
    uint32_t status = 1;
    if (m_pPlayer != nullptr) {
        status = m_pPlayer->seek(ms);
        if (mState != TAVOPLAYER_STATE_PAUSED)
            m_pPlayer->resume();
    }
    if (mClient != nullptr) {
        // A failed seek is reported as end of content, on purpose.
        if (status == 0)
            mClient->onSeeked(ms);
        else
            mClient->onEndOfContent();
    }
    TAVO_LOGI("%s millise(%d)-result=%d", __func__, ms, static_cast<int>(status));
    return status;
}

uint32_t CTavoPlayer::setSurface(const android::sp<android::Surface>& surface) {
    std::lock_guard<std::mutex> lock(mLock);
    mSurface = surface;
    if (m_pPlayer != nullptr)
        m_pPlayer->setSurface(mSurface);
    return 0;
}

uint32_t CTavoPlayer::getFrame(int32_t width, int32_t height) {
    std::lock_guard<std::mutex> lock(mLock);
    TAVO_LOGI("%s: %d %d", __func__, width, height);
    if (m_pPlayer != nullptr)
        m_pPlayer->getFrame(width, height);
    return 0;
}

uint32_t CTavoPlayer::setSoundEffect(int32_t /*effect*/, int32_t option) {
    std::lock_guard<std::mutex> lock(mLock);
    TAVO_LOGI("%s - option: %d", __func__, option);
    // Signed compare with no lower bound, as designed.
    if (option <= 9) {
        mSoundEffect = static_cast<int8_t>(option);
        if (m_pPlayer != nullptr)
            m_pPlayer->setSoundEffect(mSoundEffect);
    }
    return 0;
}

uint32_t CTavoPlayer::setCropRect(int32_t a, int32_t b, int32_t c, int32_t d, int32_t e) {
    std::lock_guard<std::mutex> lock(mLock);
    if (m_pPlayer == nullptr) {
        TAVO_LOGE("%s - m_pPlayer == NULL", __func__);
        return 1;
    }
    return m_pPlayer->setCropRect(a, b, c, d, e);
}

uint32_t CTavoPlayer::setAVSync(int32_t value) {
    std::lock_guard<std::mutex> lock(mLock);
    TAVO_LOGI("%s: %d", __func__, value);
    // The client speaks in offsets biased by 200.
    mAVSync = value - 200;
    if (m_pPlayer != nullptr)
        m_pPlayer->setAVSync(mAVSync);
    return 0;
}

uint32_t CTavoPlayer::setCaptionSync(int32_t value) {
    std::lock_guard<std::mutex> lock(mLock);
    TAVO_LOGI("%s: %d", __func__, value);
    mCaptionSync = value;
    return 0;
}

uint32_t CTavoPlayer::setCaptionLanguage(int32_t language) {
    std::lock_guard<std::mutex> lock(mLock);
    TAVO_LOGI("%s.. language = %d", __func__, language);
    return 0;
}

uint32_t CTavoPlayer::setAudioEnable(int32_t on) {
    std::lock_guard<std::mutex> lock(mLock);
    TAVO_LOGI("%s: %d", __func__, on);
    mAudioEnable = on != 0;
    return m_pPlayer != nullptr ? m_pPlayer->setAudioEnable(on) : 0;
}

uint32_t CTavoPlayer::setAudioOnlyMode(int32_t on) {
    std::lock_guard<std::mutex> lock(mLock);
    TAVO_LOGI("%s: %d", __func__, on);
    mAudioOnlyMode = on != 0;
    return m_pPlayer != nullptr ? m_pPlayer->setAudioOnlyMode(on) : 0;
}

uint32_t CTavoPlayer::setAudioPID(int32_t pid) {
    std::lock_guard<std::mutex> lock(mLock);
    TAVO_LOGI("%s: %d", __func__, pid);
    return m_pPlayer != nullptr ? m_pPlayer->setAudioPID(pid) : 0;
}

uint32_t CTavoPlayer::setCCPID(int32_t pid) {
    std::lock_guard<std::mutex> lock(mLock);
    TAVO_LOGI("%s: %d", __func__, pid);
    return m_pPlayer != nullptr ? m_pPlayer->setCCPID(pid) : 0;
}

int32_t CTavoPlayer::getFrameRate() {
    std::lock_guard<std::mutex> lock(mLock);
    return m_pPlayer != nullptr ? m_pPlayer->getFrameRate() : -1;
}

int64_t CTavoPlayer::getPCRValue() {
    android::sp<ControllerInterface> player = m_pPlayer;
    return player != nullptr ? player->getPCRValue() : 0;
}

int32_t CTavoPlayer::setAudioPathForce(int32_t mode) {
    TAVO_LOGI("%s: %d", __func__, mode);
    const android::status_t result =
        android::AudioSystem::setForceUse(android::AUDIO_POLICY_FORCE_FOR_MEDIA,
                                          static_cast<android::audio_policy_forced_cfg_t>(mode));
    if (result < 0)
        TAVO_LOGE("%s: Error to set audio path", __func__);
    return result;
}

uint32_t CTavoPlayer::startRecorder(const char* uri) {
    std::lock_guard<std::mutex> lock(mLock);
    TAVO_LOGI("%s: %s", __func__, uri != nullptr ? uri : "(null)");
    std::unique_ptr<Uri> parsed(Uri::parse(uri));
    if (parsed == nullptr)
        return kRecorderStartFailed;
    // The controller is not checked for null in the design; without one there is
    // nothing to record, which is the same failure.
    if (m_pPlayer == nullptr || m_pPlayer->startRecord(parsed.get()) != 0) {
        TAVO_LOGE("%s: Error starting recorder", __func__);
        TAVO_LOGE("%s - end", __func__);
        return kRecorderStartFailed;
    }
    return 0;
}

uint32_t CTavoPlayer::stopRecorder(int32_t flag) {
    std::lock_guard<std::mutex> lock(mLock);
    if (m_pPlayer != nullptr)
        m_pPlayer->stopRecord(flag != 0);
    return 0;
}

android::status_t CTavoPlayer::dump(int fd, const android::Vector<android::String16>& /*args*/) {
    int32_t pid = 0;
    int32_t uid = 0;
    if (android::PermissionCache::checkCallingPermission(
            android::String16("android.permission.DUMP"), &pid, &uid))
        return android::OK;
    // The message names another service; it is kept word for word.
    dprintf(fd, "Permission Denial: can't dump CameraService from pid=%d, uid=%d\n", pid, uid);
    return android::OK;
}

android::sp<ICTavoPlayerClient> CTavoPlayer::currentClient() const {
    std::lock_guard<std::mutex> lock(mClientLock);
    return mClient;
}

android::sp<ControllerInterface> CTavoPlayer::controller() {
    std::lock_guard<std::mutex> lock(mLock);
    return m_pPlayer;
}

// ---- Listener side: pipeline threads, no lock. ----

void CTavoPlayer::onCaptureFrame(unsigned char* pixels, unsigned int width, unsigned int height,
                                 bool flag) {
    android::sp<ICTavoPlayerClient> client = currentClient();
    if (client == nullptr) {
        delete[] pixels;
        return;
    }
    // The one-way proxy copies the pixels into shared memory before it returns.
    client->onCaptureFrame(pixels, static_cast<int32_t>(width), static_cast<int32_t>(height),
                           flag ? 1 : 0);
    delete[] pixels;
}

void CTavoPlayer::onClosedCaptionReceived(unsigned char* text, int length) {
    android::sp<ICTavoPlayerClient> client = currentClient();
    if (client != nullptr)
        client->closedCaptionText(text, length);
}

void CTavoPlayer::onAudioSessionId(int id) {
    android::sp<ICTavoPlayerClient> client = currentClient();
    if (client != nullptr)
        client->onAudioSessionId(id);
}

void CTavoPlayer::onFirstFrameRendered(int width, int height) {
    android::sp<ICTavoPlayerClient> client = currentClient();
    if (client != nullptr)
        client->onStartVideoTask(width, height);
}

void CTavoPlayer::onTimeUpdate(int ms) {
    TAVO_LOGD("%s elapsedTime = %d", __func__, ms);
    android::sp<ICTavoPlayerClient> client = currentClient();
    if (client != nullptr)
        client->onTimeUpdate(ms);
}

void CTavoPlayer::onEndOfContent() {
    android::sp<ICTavoPlayerClient> client = currentClient();
    if (client != nullptr)
        client->onEndOfContent();
}

void CTavoPlayer::onRecorderStarted(int status) {
    android::sp<ICTavoPlayerClient> client = currentClient();
    if (client != nullptr)
        client->onRecorderStarted(status);
}

void CTavoPlayer::onRecorderStopped(int status) {
    android::sp<ICTavoPlayerClient> client = currentClient();
    if (client != nullptr)
        client->onRecorderStopped(status);
}

void CTavoPlayer::onError(int code) {
    onError(static_cast<unsigned int>(code), nullptr);
}

void CTavoPlayer::onError(unsigned int code, const Module* module) const {
    if (module != nullptr)
        TAVO_LOGE("%s <%d> Module:%s", "onError", static_cast<int>(code),
                  module->getModuleName().c_str());
    else
        TAVO_LOGE("%s <%d>", "onError", static_cast<int>(code));
    if (code == 1 || code == kDecoderFatal) {
        TAVO_LOGE("%s: Commiting suicide due to unknown error.", "onError");
        commitSuicide();
    }
    android::sp<ICTavoPlayerClient> client = currentClient();
    if (client != nullptr)
        client->onError(static_cast<int32_t>(code));
}

void CTavoPlayer::onServiceControllerEvent(ServiceController::event_t event, unsigned int a,
                                           unsigned int b) {
    android::sp<ICTavoPlayerClient> client = currentClient();
    if (client == nullptr || event >= 6)
        return;
    const int ia = static_cast<int>(a);
    const int ib = static_cast<int>(b);
    switch (event) {
        case ServiceController::SIGNAL_UPDATE_EVENT:
            TAVO_LOGI("%s: Received SIGNAL_UPDATE_EVENT: pre %d curr %d", __func__, ia, ib);
            client->onSignalStatusChanged(ia, ib);
            break;
        case ServiceController::BUFFERING_BEGIN_EVENT:
            TAVO_LOGI("%s: Received BUFFERING_BEGIN_EVENT", __func__);
            client->onBufferingBegin();
            break;
        case ServiceController::BUFFERING_END_EVENT:
            TAVO_LOGI("%s: Received BUFFERING_END_EVENT", __func__);
            client->onBufferingEnd();
            break;
        case ServiceController::BUFFERING_EVENT:
            TAVO_LOGI("%s: Received BUFFERING_EVENT: progress %d", __func__, ia);
            client->onBuffering(ia);
            break;
        case ServiceController::START_VIDEO_TASK_EVENT:
            TAVO_LOGI("%s: Received START_VIDEO_TASK_EVENT: width: %d height: %d", __func__, ia,
                      ib);
            client->onStartVideoTask(ia, ib);
            break;
        case ServiceController::EOC_EVENT:
            TAVO_LOGI("%s: Received EOC_EVENT", __func__);
            client->onEndOfContent();
            break;
    }
}

}  // namespace TavoPlayer
