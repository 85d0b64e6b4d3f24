// MainController: the controller for live broadcast and for recorded clips played
// back through the recording service.
//
// The constructor builds the whole pipeline once (objects and rings unconfigured);
// configure() sizes the rings, reads the stream's PIDs and codec choice from the
// configuration map and wires every module:
//
//   TSReceiver --"PCRTS"---> TSParser(0) --> clock
//              --"VideoTS"-> TSParser(1) --"VideoPES"--> MediaCodecDecoder --"VideoRaw"-->
//              VideoRenderer
//              --"AudioTS"-> TSParser(2) --"AudioPES"--> MediaCodecDecoder --"AudioRaw"-->
//              AudioRenderer
//              --"CCTS"----> TSParser(3) --"CCPES"---> ClosedCaptionDecoder --"CCRaw"-->
//              ClosedCaptionRenderer
//
// start() starts the modules in that order, stop() stops them in reverse, and the
// audio, video and caption outputs are enabled together once the first frame has
// been shown and the first audio rendered, or when the playback timer runs out.
//
// Threads: the player service calls the ControllerInterface operations on its
// binder threads, serialised by its lock. The render relays come on the renderers'
// threads, the recording service's events on its own thread and the timer's expiry
// on a thread of its own; checkEnableOutputs may thus run on several threads at
// once, which is harmless (it only sets flags and disarms the timer).
#pragma once

#include <signal.h>
#include <time.h>

#include <atomic>
#include <list>
#include <map>
#include <string>

#include <utils/StrongPointer.h>

#include "common/RingBuffer.h"
#include "common/Synchronization.h"
#include "decoder/ClosedCaptionDecoder.h"
#include "decoder/MediaCodecDecoder.h"
#include "recorder/Player.h"
#include "recorder/Recorder.h"
#include "renderer/ClosedCaptionRenderer.h"
#include "service/ControllerInterface.h"
#include "tsparser/TSParser.h"
#include "tsreceiver/TSReceiver.h"

namespace TavoPlayer {

class MainController : public ControllerInterface,
                       public VideoRenderer::FrameRenderedListener,
                       public AudioRenderer::AudioRenderedListener,
                       public Decoder::DecoderInfoListener,
                       public IPlayerListener,
                       public IRecorderListener {
public:
    // Playback timer values: outputs start at the latest this long after start.
    static constexpr int kLiveTimerSec = 17;
    static constexpr int kClipTimerSec = 10;
    // Clock offsets (ms) given to the video and audio sources, and to the real PCR.
    static constexpr int kLiveOffsetMs = 2000;
    static constexpr int kClipOffsetMs = 500;
    static constexpr int kRealPCROffsetMs = 1500;

    MainController();
    ~MainController() override;

    // ControllerInterface.
    unsigned int configure(std::map<std::string, std::string>& config) override;
    unsigned int start() override;
    unsigned int stop() override;
    unsigned int pause() override;
    unsigned int resume() override;
    unsigned int seek(int position) override;
    unsigned int setSurface(android::sp<android::Surface>& surface) override;
    unsigned int dump(FILE* stream, const android::Vector<android::String16>& args,
                      int indent) override;
    unsigned int getFrame(int count, int intervalMs) override;
    int getFrameRate() override;
    int64_t getPCRValue() override;
    unsigned int setAudioPID(int pid) override;
    unsigned int setCCPID(int pid) override;
    unsigned int startRecord(Uri* uri) override;
    unsigned int stopRecord(bool keep) override;
    unsigned int setSoundEffect(int effect) override;
    unsigned int setCropRect(int a, int b, int c, int d, int e) override;
    unsigned int setAVSync(int offsetMs) override;
    unsigned int setAudioEnable(int enable) override;
    unsigned int setAudioOnlyMode(int audioOnly) override;
    unsigned int setCaptionSync(int offsetMs) override;
    unsigned int setErrorListener(ErrorListener* listener) override;
    unsigned int setCaptureFrameListener(CaptureFrameListener* listener) override;
    unsigned int setCaptionListener(ClosedCaptionListener* listener) override;
    unsigned int setAudioRenderedListener(AudioRenderer::AudioRenderedListener* listener) override;
    unsigned int setVideoRenderedListener(VideoRenderer::FrameRenderedListener* listener) override;
    unsigned int setServiceControllerListener(
        ServiceController::ServiceControllerListener* listener) override;
    unsigned int setPlayerListener(IPlayerListener* listener) override;
    unsigned int setRecorderListener(IRecorderListener* listener) override;

    unsigned int stopTSReceiver();

    // Render relays (renderers' threads).
    void onFrameRendered(int width, int height, Uint33 pts) override;
    void onFirstFrameRendered(int width, int height) override;
    void onAudioRendered() override;
    void onAudioReady(long waitMs) override;
    void onAudioSessionId(int id) override;
    void onVideoResolution(int width, int height) override;
    // Clip player and recorder relays.
    void onTimeUpdate(int seconds) override;
    void onEndOfContent() override;
    void onError(int code) override;
    void onRecorderStarted(int fileNumName) override;
    void onRecorderStopped(int result) override;

    // For tests and the dump.
    int getSourceType() const { return mSourceType; }
    int getAudioCodingType() const { return mAudioCodingType; }
    const std::list<android::sp<Module>>& modules() const { return mModules; }
    const std::list<android::sp<RingBuffer>>& rings() const { return mRings; }

private:
    void checkEnableOutputs(bool force);
    static void playbackTimerCallback(union sigval value);
    // Arms the one-shot playback timer; 0 seconds disarms it.
    int armTimer(int seconds);

    android::sp<ServiceController> m_pServiceController;
    android::sp<Synchronization> m_pSynchronization;
    android::sp<TSReceiver> m_pTSReceiver;
    android::sp<RingBuffer> m_pPCRTSRingBuffer;
    android::sp<TSParser> m_pPCRTSParser;
    android::sp<RingBuffer> m_pVideoTSRingBuffer;
    android::sp<TSParser> m_pVideoTSParser;
    android::sp<RingBuffer> m_pVideoPESRingBuffer;
    android::sp<MediaCodecDecoder> m_pVideoDecoder;
    android::sp<RingBuffer> m_pVideoRawRingBuffer;
    android::sp<VideoRenderer> m_pVideoRenderer;
    android::sp<RingBuffer> m_pAudioTSRingBuffer;
    android::sp<TSParser> m_pAudioTSParser;
    android::sp<RingBuffer> m_pAudioPESRingBuffer;
    android::sp<MediaCodecDecoder> m_pAudioDecoder;
    android::sp<RingBuffer> m_pAudioRawRingBuffer;
    android::sp<AudioRenderer> m_pAudioRenderer;
    android::sp<RingBuffer> m_pCCTSRingBuffer;
    android::sp<TSParser> m_pCCTSParser;
    android::sp<RingBuffer> m_pCCPESRingBuffer;
    android::sp<ClosedCaptionDecoder> m_pCCDecoder;
    android::sp<RingBuffer> m_pCCRawRingBuffer;
    android::sp<ClosedCaptionRenderer> m_pCCRenderer;

    std::list<android::sp<Module>> mModules;
    std::list<android::sp<RingBuffer>> mRings;

    bool mTimerCreated;
    timer_t mTimer;

    int mSourceType;
    int mAudioCodingType;
    android::sp<Player> m_pPlayer;
    android::sp<Recorder> m_pRecorder;

    std::atomic<IPlayerListener*> mPlayerListener;
    std::atomic<IRecorderListener*> mRecorderListener;
    std::atomic<VideoRenderer::FrameRenderedListener*> mVideoRenderedListener;
    std::atomic<AudioRenderer::AudioRenderedListener*> mAudioRenderedListener;

    std::atomic<bool> mVideoRendered;
    std::atomic<bool> mAudioReady;
    std::atomic<bool> mEndOfContent;
    bool mRecording;
    std::atomic<bool> mAudioEnable;

    unsigned short mPCRPid;
    unsigned short mVideoPid;
    unsigned short mAudioPid;
    unsigned short mCCPid;
};

}  // namespace TavoPlayer
