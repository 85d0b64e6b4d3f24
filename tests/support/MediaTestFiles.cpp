#include "support/MediaTestFiles.h"

#include <stdlib.h>

#include <filesystem>
#include <fstream>
#include <vector>

#include "support/TsTestUtil.h"

namespace TavoPlayer::test {

MediaTestFiles::MediaTestFiles() {
    setenv("TAVOPLAYER_PROP_tavoplayer_video_sink", "null", 1);
    setenv("TAVOPLAYER_PROP_tavoplayer_audio_sink", "null", 1);
    if (mDir.path().empty()) {
        mError = "mkdtemp failed";
        return;
    }

    const std::string d = std::to_string(kSeconds);
    const std::string ff = "ffmpeg -nostdin -hide_banner -loglevel error -y ";
    const std::string video = " -f lavfi -i testsrc2=rate=25:size=";
    const std::string tone = " -f lavfi -i sine=frequency=440:sample_rate=48000";
    const std::string h264 = " -c:v libx264 -preset ultrafast -g 25 -pix_fmt yuv420p";
    const std::string aac = " -c:a aac -b:a 64k";
    const std::string commands[] = {
        ff + video + "320x240" + tone + " -t " + d + h264 + aac +
            " -movflags +faststart -shortest '" + mp4() + "' 2>&1",
        ff + tone + " -t " + d + aac + " '" + audioOnly() + "' 2>&1",
    };
    for (const std::string& command : commands) {
        std::string out;
        if (runCommand(command, &out) != 0) {
            mError = "ffmpeg failed: " + command + "\n" + out;
            return;
        }
    }
    const std::vector<uint8_t> bytes = fileBytes(mp4());
    std::ofstream(truncated(), std::ios::binary)
        .write(reinterpret_cast<const char*>(bytes.data()),
               static_cast<std::streamsize>(bytes.size() * 6 / 10));
    std::ofstream(notMedia()) << "This is not a media file.\n";
}

}  // namespace TavoPlayer::test
