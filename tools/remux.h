// The frames of a file as the tags of a new one.
#ifndef FLVDMX_TOOLS_REMUX_H
#define FLVDMX_TOOLS_REMUX_H

#include <cstdint>
#include <functional>
#include <limits>
#include <string>
#include <vector>

#include "tools/flv_writer.h"

namespace tool {

/** Which frames to take, and how to make their timestamps. Times count from the file's first timestamp. */
struct RemuxOptions {
    bool allFrames = false;                               /**< also those later than the file's last timestamp */
    bool continuous = false;                              /**< make the timestamps continue after jumps */
    int64_t offsetMs = 0;                                 /**< added to each time */
    int64_t fromMs = std::numeric_limits<int64_t>::min(); /**< first time to take */
    int64_t toMs = std::numeric_limits<int64_t>::max();   /**< first time not to take */
    uint32_t firstTimestamp = UINT32_MAX;                 /**< of the frames, once known: of the first configurations */
};

/** What was taken. */
struct RemuxReport {
    uint64_t videoFrames = 0;
    uint64_t audioFrames = 0;
    uint32_t firstTimestamp = UINT32_MAX; /**< smallest of the frames, which need not be that of the first one */
    uint64_t jumps = 0;                   /**< of the timestamps, when they were made continuous */
    int64_t bytesLeftOut = 0;             /**< between and after the frames, in bytes of the file */
};

/** Takes a tag, whose bytes are valid during the call. */
using TakeTag = std::function<void(const NewTag&)>;

/**
 * Plays a file and makes a tag of each frame, and of each configuration before the first frame that needs it. Calls
 * with the same arguments make the same tags, and `firstTimestamp` changes no more than the timestamps of some. Throws
 * FileError.
 */
RemuxReport Remux(const std::string& file, const RemuxOptions& options, const TakeTag& take);

/**
 * Reads the tags of an undamaged file as they are, all but the onMetaData whose properties MetadataOf() returns. Throws
 * FileError, also for a damaged file and for one in which timestamps jump back.
 */
RemuxReport CopyTags(const std::string& file, const TakeTag& take);

/** @return the properties of the first onMetaData of a file; what it lacks of picture size and codecs is added */
std::vector<ScriptProperty> MetadataOf(const std::string& file);

} // namespace tool

#endif
