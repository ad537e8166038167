// The keyframe index of the metadata against the file.
#ifndef FLVDMX_TOOLS_INDEX_CHECK_H
#define FLVDMX_TOOLS_INDEX_CHECK_H

#include "tools/chain.h"

namespace tool {

/** Adds every entry that does not lead to a keyframe of about its time. */
void CheckIndex(const flvd_keyframe_index_t& index, const TagProbe& probe, Findings& findings);

} // namespace tool

#endif
