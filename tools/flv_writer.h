// Writes FLV files (FLV file format, version 10.1, annex E). A first pass over the tags measures them, so that the
// metadata at the beginning can hold an index of the keyframes; a second pass writes them.
#ifndef FLVDMX_TOOLS_FLV_WRITER_H
#define FLVDMX_TOOLS_FLV_WRITER_H

#include <algorithm>
#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include "flvdmx/metadata.hpp"
#include "tools/output_file.h"

namespace tool {

/** A tag to write. */
struct NewTag {
    uint8_t type;       /**< FLVD_TAG_TYPE_* */
    uint32_t timestamp; /**< ms */
    std::vector<uint8_t> payload;
    bool frame = false;    /**< its time contributes to the duration */
    bool keyframe = false; /**< listed in the index */
    uint32_t streamId = 0;
};

/** @return a property with this number */
flvdmx::RawProperty NumberProperty(std::string_view name, double value);

/** Measures the tags of a file, and builds the header and metadata that come before them. */
class FlvLayout {
public:
    /** Adds the next tag of the file. */
    void Add(const NewTag& tag);

    bool HasVideo() const { return m_hasVideo; }
    bool HasAudio() const { return m_hasAudio; }
    /** @return the duration in ms */
    uint32_t Duration() const { return m_lastTimestamp - std::min(m_firstTimestamp, m_lastTimestamp); }
    size_t Keyframes() const { return m_keyframes.size(); }
    uint64_t Size() const { return m_size; } /**< bytes of the tags */

    /**
     * @return the file header and the onMetaData tag with `properties`. Those that depend on the tags are replaced:
     * duration, filesize, lasttimestamp, lastkeyframetimestamp, and keyframes, an index of at most 65,536 entries.
     */
    std::vector<uint8_t> Beginning(const std::vector<flvdmx::RawProperty>& properties) const;

private:
    struct Keyframe {
        uint32_t timestamp;
        uint64_t offset; // from the first tag after onMetaData
    };

    std::vector<uint8_t> ScriptPayload(const std::vector<flvdmx::RawProperty>& properties, uint64_t firstTag) const;
    flvdmx::RawProperty Index(uint64_t firstTag) const;

    bool m_hasVideo = false;
    bool m_hasAudio = false;
    uint32_t m_firstTimestamp = UINT32_MAX;
    uint32_t m_lastTimestamp = 0;
    uint64_t m_size = 0;
    std::vector<Keyframe> m_keyframes;
};

/** Writes a tag and its back-pointer. */
void WriteTag(OutputFile& file, const NewTag& tag);

} // namespace tool

#endif
