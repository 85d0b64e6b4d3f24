#include "platform/gui/SdlVideoSink.h"

#include <pthread.h>

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <chrono>
#include <string>

#include <SDL2/SDL.h>

extern "C" {
#include <libavutil/frame.h>
}

#include "platform/gui/Deinterlacer.h"
#include "platform/os/SharedLibrary.h"
#include "platform/os/Trace.h"

namespace android {

namespace {

// SDL2, opened when the first window sink opens (see SharedLibrary): the headless
// service and the viewer never load it and its dependencies.
struct SdlLibrary {
    decltype(&::SDL_CreateRenderer) SDL_CreateRenderer;
    decltype(&::SDL_CreateTexture) SDL_CreateTexture;
    decltype(&::SDL_CreateWindow) SDL_CreateWindow;
    decltype(&::SDL_DestroyRenderer) SDL_DestroyRenderer;
    decltype(&::SDL_DestroyTexture) SDL_DestroyTexture;
    decltype(&::SDL_DestroyWindow) SDL_DestroyWindow;
    decltype(&::SDL_GetDisplayBounds) SDL_GetDisplayBounds;
    decltype(&::SDL_GetDisplayUsableBounds) SDL_GetDisplayUsableBounds;
    decltype(&::SDL_GetError) SDL_GetError;
    decltype(&::SDL_GetWindowBordersSize) SDL_GetWindowBordersSize;
    decltype(&::SDL_GetWindowDisplayIndex) SDL_GetWindowDisplayIndex;
    decltype(&::SDL_GetWindowSize) SDL_GetWindowSize;
    decltype(&::SDL_InitSubSystem) SDL_InitSubSystem;
    decltype(&::SDL_PollEvent) SDL_PollEvent;
    decltype(&::SDL_QuitSubSystem) SDL_QuitSubSystem;
    decltype(&::SDL_RenderClear) SDL_RenderClear;
    decltype(&::SDL_RenderCopy) SDL_RenderCopy;
    decltype(&::SDL_RenderPresent) SDL_RenderPresent;
    decltype(&::SDL_RenderSetLogicalSize) SDL_RenderSetLogicalSize;
    decltype(&::SDL_SetRenderDrawColor) SDL_SetRenderDrawColor;
    decltype(&::SDL_SetWindowPosition) SDL_SetWindowPosition;
    decltype(&::SDL_SetWindowSize) SDL_SetWindowSize;
    decltype(&::SDL_SetYUVConversionMode) SDL_SetYUVConversionMode;
    decltype(&::SDL_UpdateNVTexture) SDL_UpdateNVTexture;
    decltype(&::SDL_UpdateYUVTexture) SDL_UpdateYUVTexture;

    // The table, resolved once; nullptr when the library cannot be loaded (logged).
    static const SdlLibrary* get() {
        static const std::string soname = "libSDL2-2.0.so.0";
        return SharedLibrary::loadOnce<SdlLibrary>(
            soname.c_str(), [](void* handle, SdlLibrary& table) {
                return TAVO_RESOLVE(handle, table, SDL_CreateRenderer) &&
                       TAVO_RESOLVE(handle, table, SDL_CreateTexture) &&
                       TAVO_RESOLVE(handle, table, SDL_CreateWindow) &&
                       TAVO_RESOLVE(handle, table, SDL_DestroyRenderer) &&
                       TAVO_RESOLVE(handle, table, SDL_DestroyTexture) &&
                       TAVO_RESOLVE(handle, table, SDL_DestroyWindow) &&
                       TAVO_RESOLVE(handle, table, SDL_GetDisplayBounds) &&
                       TAVO_RESOLVE(handle, table, SDL_GetDisplayUsableBounds) &&
                       TAVO_RESOLVE(handle, table, SDL_GetError) &&
                       TAVO_RESOLVE(handle, table, SDL_GetWindowBordersSize) &&
                       TAVO_RESOLVE(handle, table, SDL_GetWindowDisplayIndex) &&
                       TAVO_RESOLVE(handle, table, SDL_GetWindowSize) &&
                       TAVO_RESOLVE(handle, table, SDL_InitSubSystem) &&
                       TAVO_RESOLVE(handle, table, SDL_PollEvent) &&
                       TAVO_RESOLVE(handle, table, SDL_QuitSubSystem) &&
                       TAVO_RESOLVE(handle, table, SDL_RenderClear) &&
                       TAVO_RESOLVE(handle, table, SDL_RenderCopy) &&
                       TAVO_RESOLVE(handle, table, SDL_RenderPresent) &&
                       TAVO_RESOLVE(handle, table, SDL_RenderSetLogicalSize) &&
                       TAVO_RESOLVE(handle, table, SDL_SetRenderDrawColor) &&
                       TAVO_RESOLVE(handle, table, SDL_SetWindowPosition) &&
                       TAVO_RESOLVE(handle, table, SDL_SetWindowSize) &&
                       TAVO_RESOLVE(handle, table, SDL_SetYUVConversionMode) &&
                       TAVO_RESOLVE(handle, table, SDL_UpdateNVTexture) &&
                       TAVO_RESOLVE(handle, table, SDL_UpdateYUVTexture);
            });
    }
};

// Only once get() has succeeded.
const SdlLibrary& sdl() {
    return *SdlLibrary::get();
}

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
            sdl().SDL_DestroyTexture(mTexture);
        if (mRenderer != nullptr)
            sdl().SDL_DestroyRenderer(mRenderer);
        if (mWindow != nullptr)
            sdl().SDL_DestroyWindow(mWindow);
    }

    void present(const SinkPicture& picture) {
        if (picture.interlaced && mDeinterlace && mDeinterlacer.push(picture)) {
            if (const AVFrame* frame = mDeinterlacer.pull()) {
                if (upload(SDL_PIXELFORMAT_IYUV, frame->width, frame->height) &&
                    sdl().SDL_UpdateYUVTexture(
                        mTexture, nullptr, frame->data[0], frame->linesize[0], frame->data[1],
                        frame->linesize[1], frame->data[2], frame->linesize[2]) == 0) {
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
            sdl().SDL_UpdateNVTexture(mTexture, nullptr, picture.y(), picture.lumaStride(),
                                      picture.uv(), picture.chromaStride()) == 0) {
            draw(picture.pts90k, picture.width, picture.height);
        }
    }

    void handleEvents() {
        SDL_Event event;
        while (sdl().SDL_PollEvent(&event) != 0) {
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
            mWindow = sdl().SDL_CreateWindow(
                "TavoPlayer", known ? usable.x + (usable.w - size.x) / 2 : SDL_WINDOWPOS_UNDEFINED,
                known ? usable.y + (usable.h - size.y) / 2 : SDL_WINDOWPOS_UNDEFINED, size.x,
                size.y, SDL_WINDOW_RESIZABLE | SDL_WINDOW_SHOWN);
            if (mWindow != nullptr)
                mRenderer = sdl().SDL_CreateRenderer(mWindow, -1, 0);
            if (mRenderer == nullptr) {
                TAVO_LOGE("%s: no SDL window: %s\n", __func__, sdl().SDL_GetError());
                return false;
            }
            // A window manager's title bar and frame come on top of the size asked
            // for; once it has framed the window they are known and taken off.
            int top = 0, left = 0, bottom = 0, right = 0;
            if (known &&
                sdl().SDL_GetWindowBordersSize(mWindow, &top, &left, &bottom, &right) == 0 &&
                top + left + bottom + right > 0) {
                const SDL_Point inner =
                    fitWithin(width, height, usable.w - left - right, usable.h - top - bottom);
                sdl().SDL_SetWindowSize(mWindow, inner.x, inner.y);
                sdl().SDL_SetWindowPosition(
                    mWindow, usable.x + left + (usable.w - left - right - inner.x) / 2,
                    usable.y + top + (usable.h - top - bottom - inner.y) / 2);
            }
            int shownWidth = 0, shownHeight = 0;
            sdl().SDL_GetWindowSize(mWindow, &shownWidth, &shownHeight);
            TAVO_LOGI("%s: window %dx%d for %dx%d pictures in a usable %dx%d\n", __func__,
                      shownWidth, shownHeight, width, height, usable.w, usable.h);
        } else if (width != mWidth || height != mHeight) {
            const int display = std::max(0, sdl().SDL_GetWindowDisplayIndex(mWindow));
            const SDL_Rect usable = usableBounds(display);
            const SDL_Point size = fitWithin(width, height, usable.w, usable.h);
            sdl().SDL_SetWindowSize(mWindow, size.x, size.y);
        }
        if (mTexture != nullptr && format == mFormat && width == mWidth && height == mHeight)
            return true;
        if (mTexture != nullptr)
            sdl().SDL_DestroyTexture(mTexture);
        mTexture =
            sdl().SDL_CreateTexture(mRenderer, format, SDL_TEXTUREACCESS_STREAMING, width, height);
        if (mTexture == nullptr) {
            TAVO_LOGE("%s: no SDL texture of %dx%d: %s\n", __func__, width, height,
                      sdl().SDL_GetError());
            return false;
        }
        // Letterboxing to the picture's own size keeps its aspect ratio, whatever
        // size the viewer gives the window.
        sdl().SDL_RenderSetLogicalSize(mRenderer, width, height);
        mFormat = format;
        mWidth = width;
        mHeight = height;
        return true;
    }

    // The display's area less the panels and docks of the desktop; the whole
    // display where the system cannot tell, nothing at all where it has no mode.
    static SDL_Rect usableBounds(int display) {
        SDL_Rect bounds{0, 0, 0, 0};
        if (sdl().SDL_GetDisplayUsableBounds(display, &bounds) != 0 &&
            sdl().SDL_GetDisplayBounds(display, &bounds) != 0)
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
        sdl().SDL_SetRenderDrawColor(mRenderer, 0, 0, 0, 255);
        sdl().SDL_RenderClear(mRenderer);
        sdl().SDL_RenderCopy(mRenderer, mTexture, nullptr, nullptr);
        sdl().SDL_RenderPresent(mRenderer);
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
    if (SdlLibrary::get() == nullptr)
        return nullptr;
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
    const bool started = sdl().SDL_InitSubSystem(SDL_INIT_VIDEO) == 0;
    if (!started)
        TAVO_LOGI("%s: SDL cannot show video here: %s\n", __func__, sdl().SDL_GetError());
    {
        std::lock_guard<std::mutex> lock(mLock);
        mStartup = started ? Startup::Ready : Startup::Failed;
    }
    mWake.notify_all();
    if (!started)
        return;
    // BT.601 for standard definition, BT.709 above it, as the pictures are coded.
    sdl().SDL_SetYUVConversionMode(SDL_YUV_CONVERSION_AUTOMATIC);
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
    sdl().SDL_QuitSubSystem(SDL_INIT_VIDEO);
}

}  // namespace android
