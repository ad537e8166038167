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

/** Which frames to copy, and how to change their timestamps. Times count from the file's first timestamp. */
struct RemuxOptions {
    bool allFrames = false;                               /**< also those later than the file's last timestamp */
    bool continuous = false;                              /**< make timestamps continuous across jumps */
    int64_t offsetMs = 0;                                 /**< added to each time */
    int64_t fromMs = std::numeric_limits<int64_t>::min(); /**< first time to copy */
    int64_t toMs = std::numeric_limits<int64_t>::max();   /**< first time not to copy */
    uint32_t firstTimestamp = UINT32_MAX; /**< of the frames, once known; for the configurations at the beginning */
};

/** What was copied. */
struct RemuxReport {
    uint64_t videoFrames = 0;
    uint64_t audioFrames = 0;
    uint32_t firstTimestamp = UINT32_MAX; /**< smallest of the frames, which may not be that of the first one */
    uint64_t jumps = 0;                   /**< of the timestamps, if they were made continuous */
    int64_t bytesSkipped = 0;             /**< between and after the frames, in bytes of the file */
};

/** Receives a tag, whose bytes are valid only during the call. */
using TakeTag = std::function<void(const NewTag&)>;

/**
 * Plays a file and makes a tag from each frame, and from each configuration before the first frame that needs it. Calls
 * with the same arguments produce the same tags; `firstTimestamp` changes only the timestamps of some of them. Throws
 * FileError.
 */
RemuxReport Remux(const std::string& file, const RemuxOptions& options, const TakeTag& take);

/**
 * Reads the tags of an undamaged file unchanged, except the onMetaData whose properties MetadataOf() returns. Throws
 * FileError, also if the file is damaged or its timestamps jump back.
 */
RemuxReport CopyTags(const std::string& file, const TakeTag& take);

/** @return the properties of the first onMetaData of a file; picture size and codecs are added if missing */
std::vector<ScriptProperty> MetadataOf(const std::string& file);

} // namespace tool

#endif
