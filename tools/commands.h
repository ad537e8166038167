// The commands of the tool. Each returns the exit status, DONE or FAILED. Commands that take a single file throw
// FileError when it fails.
#ifndef FLVDMX_TOOLS_COMMANDS_H
#define FLVDMX_TOOLS_COMMANDS_H

#include <cstdint>
#include <limits>
#include <optional>
#include <string>
#include <vector>

#include "flvdmx/flvdmx.h"

namespace tool {

enum ExitStatus { DONE = 0, FAILED = 1, WRONG_USE = 2 };

constexpr uint32_t BOTH_STREAMS = FLVD_STREAM_VIDEO | FLVD_STREAM_AUDIO;

enum class Format { text, json, csv };

struct InfoOptions {
    std::vector<std::string> files;
    bool json = false;
    bool scan = false; /**< count the frames */
};

struct FramesOptions {
    std::string file;
    Format format = Format::text;
    uint32_t streams = BOTH_STREAMS;                       /**< FLVD_STREAM_* bits wanted */
    bool keyframes = false;                                /**< only video keyframes */
    uint64_t count = std::numeric_limits<uint64_t>::max(); /**< stop after this many frames */
    bool separateAudio = false;
    std::optional<int32_t> fromMs{};
    std::optional<int32_t> toMs{};
    bool follow = false;
    double timeoutSeconds = 5; /**< with follow: stop after this time without growth */
};

struct SeekOptions {
    std::string file;
    int32_t timeMs = 0;
    uint32_t direction = FLVD_SEEK_BACKWARD; /**< FLVD_SEEK_BACKWARD, _FORWARD, or 0: automatic */
    uint32_t mode = 0;                       /**< other FLVD_SEEK_* bits */
    uint64_t play = 0;                       /**< frames to read before the seek */
    uint64_t count = 5;                      /**< frames to show after the seek */
    bool separateAudio = false;
    bool json = false;
};

struct ExtractOptions {
    std::string file;
    std::string out;                 /**< file name or beginning of two file names, or an existing folder */
    uint32_t streams = BOTH_STREAMS; /**< FLVD_STREAM_* bits wanted */
    bool force = false;              /**< overwrite */
};

struct CheckOptions {
    std::vector<std::string> files; /**< may be folders */
    bool json = false;
    uint32_t jobs = 1;                   /**< files to check at the same time */
    double jumpSeconds = 10;             /**< a larger step from one frame of a stream to the next is a jump */
    std::optional<double> maxGapSeconds; /**< largest distance of keyframes, and of audio and video in the file */
};

struct PlotOptions {
    std::string file;
    std::string out;
    bool force = false; /**< overwrite */
};

/** Options of the commands that write a new FLV file. */
struct RewriteOptions {
    std::string file;
    std::string out;
    bool force = false;            /**< overwrite */
    bool dryRun = false;           /**< write nothing */
    bool keepTimes = false;        /**< leave the timestamps as they are */
    std::optional<int32_t> fromMs; /**< cut: the beginning */
    std::optional<int32_t> toMs;   /**< cut: the end */
};

int RunInfo(const InfoOptions& options);
int RunFrames(const FramesOptions& options);
int RunSeek(const SeekOptions& options);
int RunExtract(const ExtractOptions& options);
int RunCheck(const CheckOptions& options);
int RunPlot(const PlotOptions& options);
int RunRepair(const RewriteOptions& options);
int RunIndex(const RewriteOptions& options);
int RunCut(const RewriteOptions& options);

} // namespace tool

#endif
