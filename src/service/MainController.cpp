#include "service/MainController.h"

#include <errno.h>

#include <cstdlib>
#include <mutex>
#include <set>

#include "platform/os/Trace.h"

namespace TavoPlayer {

namespace {

// The timer's expiry runs on a thread of its own and may race the controller's
// destruction; it acts only on a controller still registered here.
std::mutex gLiveLock;
std::set<MainController*>& liveControllers() {
    static std::set<MainController*> live;
    return live;
}

// "1", "10" and "1x" are all true: only the first character counts.
bool flagOf(const std::string& value) {
    return !value.empty() && value[0] == '1';
}

}  // namespace

MainController::MainController()
    : mTimerCreated(false),
      mTimer(),
      mSourceType(0),
      mAudioCodingType(Decoder::CODING_AAC_ADTS),
      mPlayerListener(nullptr),
      mRecorderListener(nullptr),
      mVideoRenderedListener(nullptr),
      mAudioRenderedListener(nullptr),
      mVideoRendered(false),
      mAudioReady(false),
      mEndOfContent(false),
      mRecording(false),
      mAudioEnable(true),
      mPCRPid(0),
      mVideoPid(0),
      mAudioPid(0),
      mCCPid(0) {
    m_pServiceController = new ServiceController();
    m_pSynchronization = new Synchronization();
    m_pTSReceiver = new TSReceiver();
    m_pPCRTSRingBuffer = new RingBuffer();
    m_pPCRTSParser = new TSParser(0);
    m_pVideoTSRingBuffer = new RingBuffer();
    m_pVideoTSParser = new TSParser(1);
    m_pVideoPESRingBuffer = new RingBuffer();
    m_pVideoDecoder = new MediaCodecDecoder();
    m_pVideoRawRingBuffer = new RingBuffer();
    m_pVideoRenderer = new VideoRenderer(m_pSynchronization);
    m_pAudioTSRingBuffer = new RingBuffer();
    m_pAudioTSParser = new TSParser(2);
    m_pAudioPESRingBuffer = new RingBuffer();
    m_pAudioDecoder = new MediaCodecDecoder();
    m_pAudioRawRingBuffer = new RingBuffer();
    m_pAudioRenderer = new AudioRenderer(m_pSynchronization);
    m_pCCTSRingBuffer = new RingBuffer();
    m_pCCTSParser = new TSParser(3);
    m_pCCPESRingBuffer = new RingBuffer();
    m_pCCDecoder = new ClosedCaptionDecoder();
    m_pCCRawRingBuffer = new RingBuffer();
    m_pCCRenderer = new ClosedCaptionRenderer(m_pSynchronization);

    mModules = {m_pTSReceiver,    m_pPCRTSParser,   m_pVideoTSParser, m_pVideoDecoder,
                m_pVideoRenderer, m_pAudioTSParser, m_pAudioDecoder,  m_pAudioRenderer,
                m_pCCTSParser,    m_pCCDecoder,     m_pCCRenderer};
    mRings = {m_pPCRTSRingBuffer,    m_pVideoTSRingBuffer, m_pVideoPESRingBuffer,
              m_pVideoRawRingBuffer, m_pAudioTSRingBuffer, m_pAudioPESRingBuffer,
              m_pAudioRawRingBuffer, m_pCCTSRingBuffer,    m_pCCPESRingBuffer,
              m_pCCRawRingBuffer};

    m_pVideoRenderer->setFrameRenderedListener(this);
    m_pAudioRenderer->setAudioRenderedListener(this);
    m_pVideoDecoder->setDecoderInfoListenerListener(this);

    {
        std::lock_guard<std::mutex> lock(gLiveLock);
        liveControllers().insert(this);
    }
    sigevent event{};
    event.sigev_notify = SIGEV_THREAD;
    event.sigev_value.sival_ptr = this;
    event.sigev_notify_function = &MainController::playbackTimerCallback;
    if (timer_create(CLOCK_MONOTONIC, &event, &mTimer) != 0)
        TAVO_LOGE("%s: Error creating timer (%d)\n", "MainController", errno);
    else
        mTimerCreated = true;
}

MainController::~MainController() {
    {
        std::lock_guard<std::mutex> lock(gLiveLock);
        liveControllers().erase(this);
    }
    if (mTimerCreated)
        timer_delete(mTimer);
    m_pServiceController->stopAll();
    m_pVideoRenderer->setFrameRenderedListener(nullptr);
    m_pAudioRenderer->setAudioRenderedListener(nullptr);
}

int MainController::armTimer(int seconds) {
    if (!mTimerCreated) {
        errno = EINVAL;
        return -1;
    }
    itimerspec value{};
    value.it_value.tv_sec = seconds;
    return timer_settime(mTimer, 0, &value, nullptr);
}

#define CONFIGURE_STEP(call, label)                                       \
    do {                                                                  \
        if ((call) != 0) {                                                \
            TAVO_LOGE("%s: Error configuring %s.", "configure", (label)); \
            return 1;                                                     \
        }                                                                 \
    } while (0)

unsigned int MainController::configure(std::map<std::string, std::string>& config) {
    // Every key is read with the subscript on purpose: a missing key is added to
    // the caller's map with an empty value and reads as 0 or false.
    mSourceType = atoi(config["sourceType"].c_str());
    if (mSourceType != 0) {
        m_pPlayer = new Player();
        m_pPlayer->setListener(this);
        m_pPlayer->setClipPath(config["filePath"]);
    }

    std::map<TSReceiverPIDType, unsigned short> pids;

    CONFIGURE_STEP(m_pPCRTSRingBuffer->configure("PCRTS", 12), "PCRTS RingBuffer");
    mPCRPid = static_cast<unsigned short>(atoi(config["pcrPid"].c_str()));
    pids[PCR_PID] = mPCRPid;
    CONFIGURE_STEP(m_pTSReceiver->addOutput(m_pPCRTSRingBuffer, nullptr),
                   "addOutput on TSReceiver (PCR)");
    CONFIGURE_STEP(m_pPCRTSParser->setInput(m_pPCRTSRingBuffer), "setInput on TSParser (PCR)");
    CONFIGURE_STEP(m_pPCRTSParser->configure(m_pSynchronization), "configure on TSParser (PCR)");

    CONFIGURE_STEP(m_pVideoTSRingBuffer->configure("VideoTS", 20), "VideoTS RingBuffer");
    CONFIGURE_STEP(m_pVideoPESRingBuffer->configureWithSize("VideoPES", 6 * 1024 * 1024),
                   "VideoPES RingBuffer");
    CONFIGURE_STEP(m_pVideoRawRingBuffer->configure("VideoRaw", 13), "VideoRaw RingBuffer");
    mVideoPid = static_cast<unsigned short>(atoi(config["videoPid"].c_str()));
    pids[VIDEO_PID] = mVideoPid;
    CONFIGURE_STEP(m_pTSReceiver->addOutput(m_pVideoTSRingBuffer, nullptr),
                   "addOutput on TSReceiver (Video)");
    CONFIGURE_STEP(m_pVideoTSParser->setInput(m_pVideoTSRingBuffer),
                   "setInput on TSParser (Video)");
    CONFIGURE_STEP(m_pVideoTSParser->addOutput(m_pVideoPESRingBuffer, nullptr),
                   "addOutput on TSParser (Video)");
    CONFIGURE_STEP(m_pVideoTSParser->configure(m_pSynchronization),
                   "configure on TSParser (Video)");
    CONFIGURE_STEP(m_pVideoDecoder->setInput(m_pVideoPESRingBuffer), "setInput on VideoDecoder");
    CONFIGURE_STEP(m_pVideoDecoder->addOutput(m_pVideoRawRingBuffer, nullptr),
                   "addOutput on VideoDecoder");
    CONFIGURE_STEP(m_pVideoDecoder->configure(Decoder::CODING_H264), "Video Decoder");
    CONFIGURE_STEP(m_pVideoRenderer->setInput(m_pVideoRawRingBuffer), "setInput on VideoRenderer");

    CONFIGURE_STEP(m_pAudioTSRingBuffer->configure("AudioTS", 16), "AudioTS RingBuffer");
    CONFIGURE_STEP(m_pAudioPESRingBuffer->configure("AudioPES", 16), "AudioPES RingBuffer");
    CONFIGURE_STEP(m_pAudioRawRingBuffer->configure("AudioRaw", 19), "AudioRaw RingBuffer");
    mAudioPid = static_cast<unsigned short>(atoi(config["audioPid"].c_str()));
    pids[AUDIO_PID] = mAudioPid;
    CONFIGURE_STEP(m_pTSReceiver->addOutput(m_pAudioTSRingBuffer, nullptr),
                   "addOutput on TSReceiver (Audio)");
    CONFIGURE_STEP(m_pAudioTSParser->setInput(m_pAudioTSRingBuffer),
                   "setInput on TSParser (Audio)");
    CONFIGURE_STEP(m_pAudioTSParser->addOutput(m_pAudioPESRingBuffer, nullptr),
                   "addOutput on TSParser (Audio)");
    CONFIGURE_STEP(m_pAudioTSParser->configure(m_pSynchronization),
                   "configure on TSParser (Audio)");
    CONFIGURE_STEP(m_pAudioDecoder->setInput(m_pAudioPESRingBuffer), "setInput on AudioDecoder");
    CONFIGURE_STEP(m_pAudioDecoder->addOutput(m_pAudioRawRingBuffer, nullptr),
                   "setOutput on AudioDecoder");
    if (flagOf(config["IsLATMAudio"]))
        mAudioCodingType = Decoder::CODING_AAC_LATM;
    else if (flagOf(config["isMPEG2Audio"]))
        mAudioCodingType = Decoder::CODING_MPEG_AUDIO;
    else
        mAudioCodingType = Decoder::CODING_AAC_ADTS;
    CONFIGURE_STEP(m_pAudioDecoder->configure(static_cast<Decoder::codingType_t>(mAudioCodingType)),
                   "Audio Decoder");
    CONFIGURE_STEP(m_pAudioRenderer->setInput(m_pAudioRawRingBuffer), "setInput on AudioRenderer");
    CONFIGURE_STEP(m_pAudioRenderer->configure(), "Audio Renderer");

    CONFIGURE_STEP(m_pCCTSRingBuffer->configure("CCTS", 12), "CCTS RingBuffer");
    CONFIGURE_STEP(m_pCCPESRingBuffer->configure("CCPES", 13), "CCPES RingBuffer");
    CONFIGURE_STEP(m_pCCRawRingBuffer->configure("CCRaw", 12), "CCRaw RingBuffer");
    mCCPid = static_cast<unsigned short>(atoi(config["subtitlePid"].c_str()));
    pids[CC_PID] = mCCPid;
    CONFIGURE_STEP(m_pTSReceiver->addOutput(m_pCCTSRingBuffer, nullptr),
                   "addOutput on TSReceiver (Closed Caption)");
    CONFIGURE_STEP(m_pCCTSParser->setInput(m_pCCTSRingBuffer),
                   "setInput on TSParser (Closed Caption)");
    CONFIGURE_STEP(m_pCCTSParser->addOutput(m_pCCPESRingBuffer, nullptr),
                   "addOutput on TSParser (Closed Caption)");
    CONFIGURE_STEP(m_pCCTSParser->configure(m_pSynchronization),
                   "configure on TSParser (Closed Caption)");
    CONFIGURE_STEP(m_pCCDecoder->setInput(m_pCCPESRingBuffer), "setInput on ClosedCaptionDecoder");
    CONFIGURE_STEP(m_pCCDecoder->addOutput(m_pCCRawRingBuffer, nullptr),
                   "addOutput on ClosedCaptionDecoder");
    CONFIGURE_STEP(m_pCCRenderer->setInput(m_pCCRawRingBuffer),
                   "setInput on ClosedCaptionRenderer");

    const unsigned int result = m_pTSReceiver->configure(pids);
    if (result != 0)
        TAVO_LOGE("%s: Error configuring %s.", "configure", "configure on TSReceiver");
    return result;
}

#undef CONFIGURE_STEP

unsigned int MainController::start() {
    int timerSec = kLiveTimerSec;
    if (mSourceType != 0) {
        mEndOfContent = false;
        if (m_pPlayer != nullptr)
            m_pPlayer->start();
        m_pSynchronization->setOffsetTime(kClipOffsetMs, Synchronization::Video);
        m_pSynchronization->setOffsetTime(kClipOffsetMs, Synchronization::Audio);
        timerSec = kClipTimerSec;
    } else {
        m_pServiceController->startCheckSignal();
        m_pServiceController->startCheckFrameRate();
        m_pSynchronization->setOffsetTime(kLiveOffsetMs, Synchronization::Video);
        m_pSynchronization->setOffsetTime(kLiveOffsetMs, Synchronization::Audio);
    }
    // "playack" is the message as it has always read.
    if (armTimer(timerSec) != 0)
        TAVO_LOGE("%s: Error enabling playack timer (%d)\n", "start", errno);
    m_pSynchronization->setOffsetTime(kRealPCROffsetMs, Synchronization::RealPCR);
    m_pServiceController->startBuffering();

    for (const android::sp<Module>& module : mModules) {
        const unsigned int result = module->start();
        if (result != 0) {
            TAVO_LOGE("%s: Error starting module %s", "start", module->getModuleName().c_str());
            return result;
        }
    }
    return 0;
}

unsigned int MainController::stop() {
    if (mSourceType == 2 && !mEndOfContent && m_pPlayer != nullptr)
        m_pPlayer->stop();
    if (m_pRecorder != nullptr && mRecording) {
        m_pRecorder->stop(false);
        m_pRecorder.clear();
        mRecording = false;
    }
    m_pServiceController->stopAll();
    for (auto it = mModules.rbegin(); it != mModules.rend(); ++it) {
        const unsigned int result = (*it)->stop();
        if (result != 0) {
            TAVO_LOGE("%s: Error stopping module %s", "stop", (*it)->getModuleName().c_str());
            return result;
        }
    }
    for (const android::sp<RingBuffer>& ring : mRings)
        ring->reset();
    m_pSynchronization->resetPCR();
    mVideoRendered = false;
    m_pAudioRenderer->setOutputEnable(false);
    m_pVideoRenderer->setOutputEnable(false);
    m_pCCRenderer->setEnabled(0);
    // The playback timer stays armed: if it fires later it enables the outputs,
    // which is accepted.
    return 0;
}

void MainController::checkEnableOutputs(bool force) {
    if (!force && !(mVideoRendered && mAudioReady))
        return;
    m_pAudioRenderer->setOutputEnable(mAudioEnable.load());
    m_pVideoRenderer->setOutputEnable(true);
    m_pCCRenderer->setEnabled(1);
    m_pServiceController->stopBuffering();
    if (armTimer(0) != 0)
        TAVO_LOGE("%s: Error disabling playack timer (%d)\n", "checkEnableOutputs", errno);
}

void MainController::playbackTimerCallback(union sigval value) {
    auto* controller = static_cast<MainController*>(value.sival_ptr);
    std::lock_guard<std::mutex> lock(gLiveLock);
    if (liveControllers().count(controller) == 0)
        return;
    TAVO_LOGI("%s: Playback timer timeout. Enabling audio and video.\n", "playbackTimerCallback");
    controller->checkEnableOutputs(true);
}

unsigned int MainController::pause() {
    TAVO_LOGI("%s\n", "pause");
    if (mEndOfContent)
        m_pServiceController->stopCheckEndOfContent();
    else if (m_pPlayer != nullptr)
        m_pPlayer->pause();
    const unsigned int audio = m_pAudioRenderer->stop();
    if (audio != 0)
        return audio;
    const unsigned int video = m_pVideoRenderer->stop();
    m_pSynchronization->pause();
    return video;
}

unsigned int MainController::resume() {
    TAVO_LOGI("%s\n", "resume");
    m_pSynchronization->resume();
    unsigned int result = m_pAudioRenderer->start();
    if (result == 0)
        result = m_pVideoRenderer->start();
    if (!mEndOfContent) {
        if (m_pPlayer != nullptr)
            m_pPlayer->resume();
    } else {
        m_pServiceController->startCheckEndOfContent();
    }
    return result;
}

unsigned int MainController::seek(int position) {
    TAVO_LOGI("%s\n", "seek");
    if (m_pPlayer == nullptr || !m_pPlayer->isPossibleSeek() || mEndOfContent)
        return 1;
    stop();
    m_pPlayer->seek(position);

    android::sp<android::Surface> surface = m_pVideoDecoder->getSurface();
    mModules.remove(android::sp<Module>(m_pVideoDecoder));
    m_pVideoDecoder.clear();
    m_pVideoDecoder = new MediaCodecDecoder();
    m_pVideoDecoder->setDecoderInfoListenerListener(this);
    // First in the list from now on: started first and stopped last, on purpose.
    // Nor does it get the error listener the constructor's modules were given:
    // both are the required behaviour.
    mModules.push_front(m_pVideoDecoder);
    if (m_pVideoDecoder->setInput(m_pVideoPESRingBuffer) != 0) {
        TAVO_LOGE("%s: Error configuring %s.", "seek", "setInput on VideoDecoder");
        return 1;
    }
    if (m_pVideoDecoder->addOutput(m_pVideoRawRingBuffer, nullptr) != 0) {
        TAVO_LOGE("%s: Error configuring %s.", "seek", "addOutput on VideoDecoder");
        return 1;
    }
    if (m_pVideoDecoder->configure(Decoder::CODING_H264) != 0) {
        TAVO_LOGE("%s: Error configuring %s.", "seek", "Video Decoder");
        return 1;
    }
    m_pVideoDecoder->setSurface(surface);
    return start();
}

unsigned int MainController::setSurface(android::sp<android::Surface>& surface) {
    return m_pVideoDecoder->setSurface(surface);
}

unsigned int MainController::dump(FILE* stream, const android::Vector<android::String16>& /*args*/,
                                  int indent) {
    if (stream == nullptr)
        return 0;
    const std::string prefix(indent > 0 ? static_cast<size_t>(indent) : 0, '\t');
    // "MainControler" is the heading as it has always read.
    fprintf(stream, "%sMainControler:\n", prefix.c_str());
    fprintf(stream, "%s+ Ring Buffers:\n", prefix.c_str());
    for (const android::sp<RingBuffer>& ring : mRings)
        ring->dump(stream, indent + 2);
    fprintf(stream, "\n%s+ Modules:\n", prefix.c_str());
    for (const android::sp<Module>& module : mModules)
        module->dump(stream, indent + 2);
    fprintf(stream, "\n%s+ Synchronization:\n", prefix.c_str());
    m_pSynchronization->dump(stream, indent + 2);
    return 0;
}

unsigned int MainController::getFrame(int count, int intervalMs) {
    return m_pVideoRenderer->getFrame(count, intervalMs);
}

int MainController::getFrameRate() {
    return m_pServiceController->getFrameRate();
}

int64_t MainController::getPCRValue() {
    return static_cast<int64_t>(m_pSynchronization->getPCR());
}

unsigned int MainController::setAudioPID(int pid) {
    const auto newPid = static_cast<unsigned short>(pid);
    if (m_pTSReceiver->changePID(AUDIO_PID, mAudioPid, newPid) != 0)
        return 1;
    mAudioPid = newPid;
    return 0;
}

unsigned int MainController::setCCPID(int pid) {
    const auto newPid = static_cast<unsigned short>(pid);
    if (m_pTSReceiver->isPIDSet(mCCPid)) {
        if (m_pTSReceiver->changePID(CC_PID, mCCPid, newPid) != 0)
            return 1;
        TAVO_LOGI("%s setCCPID: %d -> %d", "setCCPID", mCCPid, newPid);
    } else {
        if (m_pTSReceiver->addOutput(m_pCCTSRingBuffer, nullptr) != 0) {
            TAVO_LOGE("%s: Error configuring %s.", "setCCPID",
                      "addOutput on TSReceiver (Closed Caption)");
            return 1;
        }
        if (m_pTSReceiver->startFilteringNewPID(CC_PID, newPid) != 0)
            return 1;
    }
    mCCPid = newPid;
    return 0;
}

unsigned int MainController::stopTSReceiver() {
    return m_pTSReceiver->stop();
}

unsigned int MainController::startRecord(Uri* uri) {
    int recType = 0;
    if (uri != nullptr) {
        auto it = uri->mQueries.find("recType");
        if (it != uri->mQueries.end())
            recType = atoi(it->second.c_str());
    }
    TAVO_LOGD("%s recType = %d", "startRecord", recType);
    if (mRecording)
        return 1;
    m_pRecorder = new Recorder();
    m_pRecorder->setListener(this);
    m_pRecorder->start(uri, mVideoPid, mAudioPid, mCCPid, mAudioCodingType - 1);
    mRecording = true;
    return 0;
}

unsigned int MainController::stopRecord(bool keep) {
    TAVO_LOGI("%s\n", "stopRecord");
    if (!mRecording)
        return 1;
    m_pRecorder->stop(keep ? 1 : 0);
    m_pRecorder.clear();
    mRecording = false;
    return 0;
}

unsigned int MainController::setSoundEffect(int effect) {
    return m_pAudioRenderer->setSoundEffect(effect);
}

unsigned int MainController::setCropRect(int a, int b, int c, int d, int e) {
    if (m_pVideoDecoder == nullptr)
        return 1;
    return m_pVideoDecoder->setCropRect(a, b, c, d, e);
}

unsigned int MainController::setAVSync(int offsetMs) {
    m_pVideoRenderer->setAVSync(offsetMs);
    return 0;
}

unsigned int MainController::setAudioEnable(int enable) {
    mAudioEnable = enable != 0;
    return 0;
}

unsigned int MainController::setAudioOnlyMode(int audioOnly) {
    return m_pVideoDecoder->setAudioOnlyMode(audioOnly);
}

unsigned int MainController::setCaptionSync(int offsetMs) {
    m_pCCRenderer->setCaptionSync(offsetMs);
    return 0;
}

unsigned int MainController::setErrorListener(ErrorListener* listener) {
    if (listener == nullptr)
        return 0;
    for (const android::sp<Module>& module : mModules)
        module->addErrorListener(*listener);
    return 0;
}

unsigned int MainController::setCaptureFrameListener(CaptureFrameListener* listener) {
    m_pVideoRenderer->setCaptureFrameListener(listener);
    return 0;
}

unsigned int MainController::setCaptionListener(ClosedCaptionListener* listener) {
    m_pCCRenderer->registerListener(listener);
    return 0;
}

unsigned int MainController::setAudioRenderedListener(
    AudioRenderer::AudioRenderedListener* listener) {
    mAudioRenderedListener = listener;
    return 0;
}

unsigned int MainController::setVideoRenderedListener(
    VideoRenderer::FrameRenderedListener* listener) {
    mVideoRenderedListener = listener;
    return 0;
}

unsigned int MainController::setServiceControllerListener(
    ServiceController::ServiceControllerListener* listener) {
    m_pServiceController->setListener(listener);
    return 0;
}

unsigned int MainController::setPlayerListener(IPlayerListener* listener) {
    mPlayerListener = listener;
    return 0;
}

unsigned int MainController::setRecorderListener(IRecorderListener* listener) {
    mRecorderListener = listener;
    return 0;
}

void MainController::onFrameRendered(int width, int height, Uint33 pts) {
    m_pServiceController->onFrameRendered(width, height, pts);
    VideoRenderer::FrameRenderedListener* listener = mVideoRenderedListener.load();
    if (listener != nullptr)
        listener->onFrameRendered(width, height, pts);
    if (!mVideoRendered.exchange(true))
        checkEnableOutputs(false);
    if (mSourceType == 2 && !mEndOfContent && mVideoRendered && mAudioReady && m_pPlayer != nullptr)
        m_pPlayer->updateCurTime(pts);
}

void MainController::onFirstFrameRendered(int width, int height) {
    VideoRenderer::FrameRenderedListener* listener = mVideoRenderedListener.load();
    if (listener != nullptr)
        listener->onFirstFrameRendered(width, height);
}

void MainController::onAudioRendered() {
    if (!mAudioReady.exchange(true))
        checkEnableOutputs(false);
}

void MainController::onAudioReady(long waitMs) {
    m_pServiceController->onAudioReady(waitMs);
}

void MainController::onAudioSessionId(int id) {
    AudioRenderer::AudioRenderedListener* listener = mAudioRenderedListener.load();
    if (listener != nullptr)
        listener->onAudioSessionId(id);
}

void MainController::onVideoResolution(int width, int height) {
    ServiceController::ServiceControllerListener* listener = m_pServiceController->getListener();
    if (listener != nullptr && m_pServiceController->isFirstFrameFlagSet())
        listener->onServiceControllerEvent(ServiceController::START_VIDEO_TASK_EVENT,
                                           static_cast<unsigned int>(width),
                                           static_cast<unsigned int>(height));
}

void MainController::onTimeUpdate(int seconds) {
    IPlayerListener* listener = mPlayerListener.load();
    if (listener != nullptr)
        listener->onTimeUpdate(seconds);
}

void MainController::onEndOfContent() {
    TAVO_LOGI("%s\n", "onEndOfContent");
    if (m_pPlayer != nullptr && m_pPlayer->getDuration() != 0)
        onTimeUpdate(static_cast<int>(m_pPlayer->getDuration() / 1000));
    mEndOfContent = true;
    m_pServiceController->startCheckEndOfContent();
}

void MainController::onError(int code) {
    IPlayerListener* player = mPlayerListener.load();
    if (player != nullptr) {
        player->onError(code);
        return;
    }
    IRecorderListener* recorder = mRecorderListener.load();
    if (recorder != nullptr)
        recorder->onError(code);
}

void MainController::onRecorderStarted(int fileNumName) {
    IRecorderListener* listener = mRecorderListener.load();
    if (listener != nullptr)
        listener->onRecorderStarted(fileNumName);
}

void MainController::onRecorderStopped(int result) {
    IRecorderListener* listener = mRecorderListener.load();
    if (listener != nullptr)
        listener->onRecorderStopped(result);
}

}  // namespace TavoPlayer
