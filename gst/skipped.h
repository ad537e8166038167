/*
 * What the library has skipped: valid tags that it does not deliver, or damage.
 */
#pragma once

#include "source.h"

#include "flvdmx/flvdmx.hpp"

#include <cstdint>
#include <optional>
#include <string>

namespace flvdmx_gst {

/** Reads the tag at a position. Returns nothing if it is empty, or if its header and its back-pointer do not agree. */
std::optional<flvdmx::Tag> read_tag(Source& source, int64_t position);

/** Number of tags to examine: tags without frames may come before the skipped ones. */
constexpr int examined_tags = 8;

/** True if, among the first tags at a position, two in a row are later than the last timestamp of the file as the
 *  library knows it: then the timestamps restart somewhere after them. */
bool is_before_restart(Source& source, int64_t position, const flvdmx::File& file);

/** Returns why the tag does not match the file's description, as a sentence; "" if it does. */
std::string reason_to_skip(const flvdmx::Tag& tag, const flvdmx::File& file, const flvdmx::Info& info);

} // namespace flvdmx_gst
