// The subcommands of the tool. Each returns the exit code, DONE or FAILED, and has told the user of its failures.
#ifndef FLVDMX_TOOLS_COMMANDS_H
#define FLVDMX_TOOLS_COMMANDS_H

#include <cstdint>
#include <limits>
#include <optional>
#include <string>
#include <vector>

#include "flvdmx/flvdmx.h"

namespace tool {

enum ExitCode { DONE = 0, FAILED = 1, WRONG_USE = 2 };

struct InfoOptions {
    std::vector<std::string> files;
    bool json = false;
};

struct FramesOptions {
    std::string file;
    bool json = false;
    uint32_t streams = FLVD_STREAM_VIDEO | FLVD_STREAM_AUDIO; /**< FLVD_STREAM_* bits wanted */
    uint64_t count = std::numeric_limits<uint64_t>::max();    /**< frames after which to stop */
    bool separateAudio = false;
    std::optional<int32_t> fromMs{};
    std::optional<int32_t> toMs{};
    bool follow = false;
    double timeoutSeconds = 5; /**< following: time without growth after which to stop */
};

struct SeekOptions {
    std::string file;
    int32_t timeMs = 0;
    uint32_t mode = 0;  /**< FLVD_SEEK_* bits */
    uint64_t play = 0;  /**< frames to read before the seek */
    uint64_t count = 5; /**< frames to show behind the landing place */
    bool separateAudio = false;
    bool json = false;
};

struct ExtractOptions {
    std::string file;
    std::string out;                                          /**< file or base name, or a folder that exists */
    uint32_t streams = FLVD_STREAM_VIDEO | FLVD_STREAM_AUDIO; /**< FLVD_STREAM_* bits wanted */
};

struct CheckOptions {
    std::vector<std::string> files;
    bool json = false;
    uint32_t jobs = 1;       /**< files that are checked at the same time */
    double jumpSeconds = 10; /**< largest step from one frame of a stream to the next that is no jump */
};

struct PlotOptions {
    std::string file;
    std::string out;
};

int RunInfo(const InfoOptions& options);
int RunFrames(const FramesOptions& options);
int RunSeek(const SeekOptions& options);
int RunExtract(const ExtractOptions& options);
int RunCheck(const CheckOptions& options);
int RunPlot(const PlotOptions& options);

} // namespace tool

#endif
