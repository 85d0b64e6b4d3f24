#include "platform/gui/SdlVideoSink.h"

#include <pthread.h>

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <chrono>

#include <SDL2/SDL.h>

extern "C" {
#include <libavutil/frame.h>
}

#include "platform/gui/Deinterlacer.h"
#include "platform/os/Trace.h"

namespace android {

namespace {

// SDL's video subsystem may be started by one thread of the process at a time.
std::atomic<bool> gWindowOpen{false};

// The largest size with the picture's aspect ratio that fits in `bounds`; a picture
// that fits already keeps its own size (pixels are not enlarged unasked).
SDL_Point fitWithin(int width, int height, int boundsWidth, int boundsHeight) {
    if (boundsWidth <= 0 || boundsHeight <= 0 || (width <= boundsWidth && height <= boundsHeight))
        return {width, height};
    const double scale = std::min(static_cast<double>(boundsWidth) / width,
                                  static_cast<double>(boundsHeight) / height);
    return {std::max(1, static_cast<int>(width * scale)),
            std::max(1, static_cast<int>(height * scale))};
}

}  // namespace

// Everything SDL: lives on the sink's thread only.
class SdlVideoSink::Window {
public:
    Window(ShowLog& log, bool deinterlace) : mLog(log), mDeinterlace(deinterlace) {}
    ~Window() {
        if (mTexture != nullptr)
            SDL_DestroyTexture(mTexture);
        if (mRenderer != nullptr)
            SDL_DestroyRenderer(mRenderer);
        if (mWindow != nullptr)
            SDL_DestroyWindow(mWindow);
    }

    void present(const SinkPicture& picture) {
        if (picture.interlaced && mDeinterlace && mDeinterlacer.push(picture)) {
            if (const AVFrame* frame = mDeinterlacer.pull()) {
                if (upload(SDL_PIXELFORMAT_IYUV, frame->width, frame->height) &&
                    SDL_UpdateYUVTexture(mTexture, nullptr, frame->data[0], frame->linesize[0],
                                         frame->data[1], frame->linesize[1], frame->data[2],
                                         frame->linesize[2]) == 0) {
                    draw(static_cast<uint64_t>(frame->pts), frame->width, frame->height);
                }
                return;
            }
            // The filter runs one picture behind: until it gives its first, the
            // window shows the woven picture rather than nothing.
            if (mShownAny)
                return;
        }
        if (upload(SDL_PIXELFORMAT_NV12, picture.width, picture.height) &&
            SDL_UpdateNVTexture(mTexture, nullptr, picture.y(), picture.lumaStride(), picture.uv(),
                                picture.chromaStride()) == 0) {
            draw(picture.pts90k, picture.width, picture.height);
        }
    }

    void handleEvents() {
        SDL_Event event;
        while (SDL_PollEvent(&event) != 0) {
            // A resized or uncovered window is drawn again from the last texture;
            // closing the window is the viewer application's business, not ours.
            if (event.type == SDL_WINDOWEVENT &&
                (event.window.event == SDL_WINDOWEVENT_SIZE_CHANGED ||
                 event.window.event == SDL_WINDOWEVENT_EXPOSED)) {
                redraw();
            }
        }
    }

private:
    // Makes the window, renderer and texture fit a picture of this format and size.
    bool upload(uint32_t format, int width, int height) {
        if (mWindow == nullptr) {
            const SDL_Rect usable = usableBounds(0);
            const SDL_Point size = fitWithin(width, height, usable.w, usable.h);
            const bool known = usable.w > 0 && usable.h > 0;
            mWindow = SDL_CreateWindow(
                "TavoPlayer", known ? usable.x + (usable.w - size.x) / 2 : SDL_WINDOWPOS_UNDEFINED,
                known ? usable.y + (usable.h - size.y) / 2 : SDL_WINDOWPOS_UNDEFINED, size.x,
                size.y, SDL_WINDOW_RESIZABLE | SDL_WINDOW_SHOWN);
            if (mWindow != nullptr)
                mRenderer = SDL_CreateRenderer(mWindow, -1, 0);
            if (mRenderer == nullptr) {
                TAVO_LOGE("%s: no SDL window: %s\n", __func__, SDL_GetError());
                return false;
            }
            // A window manager's title bar and frame come on top of the size asked
            // for; once it has framed the window they are known and taken off.
            int top = 0, left = 0, bottom = 0, right = 0;
            if (known && SDL_GetWindowBordersSize(mWindow, &top, &left, &bottom, &right) == 0 &&
                top + left + bottom + right > 0) {
                const SDL_Point inner =
                    fitWithin(width, height, usable.w - left - right, usable.h - top - bottom);
                SDL_SetWindowSize(mWindow, inner.x, inner.y);
                SDL_SetWindowPosition(mWindow,
                                      usable.x + left + (usable.w - left - right - inner.x) / 2,
                                      usable.y + top + (usable.h - top - bottom - inner.y) / 2);
            }
            int shownWidth = 0, shownHeight = 0;
            SDL_GetWindowSize(mWindow, &shownWidth, &shownHeight);
            TAVO_LOGI("%s: window %dx%d for %dx%d pictures in a usable %dx%d\n", __func__,
                      shownWidth, shownHeight, width, height, usable.w, usable.h);
        } else if (width != mWidth || height != mHeight) {
            const int display = std::max(0, SDL_GetWindowDisplayIndex(mWindow));
            const SDL_Rect usable = usableBounds(display);
            const SDL_Point size = fitWithin(width, height, usable.w, usable.h);
            SDL_SetWindowSize(mWindow, size.x, size.y);
        }
        if (mTexture != nullptr && format == mFormat && width == mWidth && height == mHeight)
            return true;
        if (mTexture != nullptr)
            SDL_DestroyTexture(mTexture);
        mTexture = SDL_CreateTexture(mRenderer, format, SDL_TEXTUREACCESS_STREAMING, width, height);
        if (mTexture == nullptr) {
            TAVO_LOGE("%s: no SDL texture of %dx%d: %s\n", __func__, width, height, SDL_GetError());
            return false;
        }
        // Letterboxing to the picture's own size keeps its aspect ratio, whatever
        // size the viewer gives the window.
        SDL_RenderSetLogicalSize(mRenderer, width, height);
        mFormat = format;
        mWidth = width;
        mHeight = height;
        return true;
    }

    // The display's area less the panels and docks of the desktop; the whole
    // display where the system cannot tell, nothing at all where it has no mode.
    static SDL_Rect usableBounds(int display) {
        SDL_Rect bounds{0, 0, 0, 0};
        if (SDL_GetDisplayUsableBounds(display, &bounds) != 0 &&
            SDL_GetDisplayBounds(display, &bounds) != 0)
            bounds = {0, 0, 0, 0};
        return bounds;
    }

    void draw(uint64_t pts90k, int width, int height) {
        redraw();
        mShownAny = true;
        mLog.record(pts90k, width, height);
    }

    void redraw() {
        if (mRenderer == nullptr || mTexture == nullptr)
            return;
        SDL_SetRenderDrawColor(mRenderer, 0, 0, 0, 255);
        SDL_RenderClear(mRenderer);
        SDL_RenderCopy(mRenderer, mTexture, nullptr, nullptr);
        SDL_RenderPresent(mRenderer);
    }

    ShowLog& mLog;
    const bool mDeinterlace;
    Deinterlacer mDeinterlacer;
    SDL_Window* mWindow = nullptr;
    SDL_Renderer* mRenderer = nullptr;
    SDL_Texture* mTexture = nullptr;
    uint32_t mFormat = 0;
    int mWidth = 0;
    int mHeight = 0;
    bool mShownAny = false;
};

std::unique_ptr<SdlVideoSink> SdlVideoSink::open(ShowLog& log, bool deinterlace) {
    bool expected = false;
    if (!gWindowOpen.compare_exchange_strong(expected, true)) {
        TAVO_LOGE("%s: a window sink is open already\n", __func__);
        return nullptr;
    }
    std::unique_ptr<SdlVideoSink> sink(new SdlVideoSink(log, deinterlace));
    std::unique_lock<std::mutex> lock(sink->mLock);
    sink->mThread = std::thread([raw = sink.get()] { raw->run(); });
    // SDL answers at once whether it can reach a display; the bound only guards
    // against a display server that never answers.
    const bool answered = sink->mWake.wait_for(lock, std::chrono::seconds(10),
                                               [&] { return sink->mStartup != Startup::Pending; });
    const bool ready = answered && sink->mStartup == Startup::Ready;
    lock.unlock();
    if (!ready) {
        if (!answered)
            TAVO_LOGE("%s: the display did not answer\n", __func__);
        return nullptr;  // the destructor joins the thread once it gives up
    }
    return sink;
}

SdlVideoSink::SdlVideoSink(ShowLog& log, bool deinterlace) : mLog(log), mDeinterlace(deinterlace) {}

SdlVideoSink::~SdlVideoSink() {
    {
        std::lock_guard<std::mutex> lock(mLock);
        mQuit = true;
    }
    mWake.notify_all();
    if (mThread.joinable())
        mThread.join();
    gWindowOpen.store(false);
}

int SdlVideoSink::show(const std::shared_ptr<const SinkPicture>& picture) {
    bool replaced = false;
    {
        std::lock_guard<std::mutex> lock(mLock);
        replaced = mPending != nullptr;
        mPending = picture;
    }
    if (replaced)
        mLog.recordDropped();
    mWake.notify_all();
    return 0;
}

void SdlVideoSink::run() {
    pthread_setname_np(pthread_self(), "SdlVideoSink");
    const bool started = SDL_InitSubSystem(SDL_INIT_VIDEO) == 0;
    if (!started)
        TAVO_LOGI("%s: SDL cannot show video here: %s\n", __func__, SDL_GetError());
    {
        std::lock_guard<std::mutex> lock(mLock);
        mStartup = started ? Startup::Ready : Startup::Failed;
    }
    mWake.notify_all();
    if (!started)
        return;
    // BT.601 for standard definition, BT.709 above it, as the pictures are coded.
    SDL_SetYUVConversionMode(SDL_YUV_CONVERSION_AUTOMATIC);
    {
        Window window(mLog, mDeinterlace);
        std::unique_lock<std::mutex> lock(mLock);
        while (!mQuit) {
            mWake.wait_for(lock, std::chrono::milliseconds(kEventPollMs),
                           [this] { return mQuit || mPending != nullptr; });
            std::shared_ptr<const SinkPicture> picture = std::move(mPending);
            mPending.reset();
            lock.unlock();
            if (picture != nullptr)
                window.present(*picture);
            window.handleEvents();
            lock.lock();
        }
    }
    SDL_QuitSubSystem(SDL_INIT_VIDEO);
}

}  // namespace android
