/*
 * What lies where the library skipped tags: valid tags that it does not deliver, or damage.
 */
#pragma once

#include "source.h"

#include "flvdmx/flvdmx.hpp"

#include <cstdint>
#include <optional>
#include <string>

namespace flvdmx_gst {

/** A valid tag. */
struct RawTag {
    flvdmx::Stream stream = flvdmx::Stream::any; // any: script data
    uint8_t codec_byte = 0;
    uint32_t timestamp = 0; // ms, of the file
    int64_t end = 0;        // file position after its back-pointer

    flvdmx::VideoCodec video_codec() const { return static_cast<flvdmx::VideoCodec>(codec_byte & 15); }
    flvdmx::AudioCodec audio_codec() const { return static_cast<flvdmx::AudioCodec>(codec_byte >> 4); }
};

/** Reads the tag at a position; none when its header and its back-pointer do not agree. */
std::optional<RawTag> read_tag(Source& source, int64_t position);

/** How many tags are examined: those that are skipped may come after some that carry no frame. */
constexpr int examined_tags = 8;

/** True when two tags in a row, of the first ones at a position, are later than what the library takes for the end of
 *  the file: then the timestamps start again somewhere after them. */
bool is_before_restart(Source& source, int64_t position, const flvdmx::File& file);

/** Why the file's description rules out the tag, as a sentence; "" when it does not. */
std::string reason_to_skip(const RawTag& tag, const flvdmx::File& file, const flvdmx::Info& info);

} // namespace flvdmx_gst
