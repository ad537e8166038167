// AAC frames as an audio data transport stream (ISO/IEC 13818-7, 14496-3).
#ifndef FLVDMX_TOOLS_ADTS_H
#define FLVDMX_TOOLS_ADTS_H

#include <cstdint>
#include <string>
#include <vector>

namespace tool {

/** Puts a header in front of every frame. */
class Adts {
public:
    /**
     * Takes an AudioSpecificConfig, valid for the frames behind it. Of HE-AAC the headers describe the core; decoders
     * find the rest in the frames.
     * @return why it cannot be written, the one before staying valid; empty when it can
     */
    std::string Configure(const std::vector<uint8_t>& config);

    /** Appends a frame to `out`. @return false when it is too long for the header's length field */
    bool Convert(const std::vector<uint8_t>& frame, std::vector<uint8_t>& out) const;

private:
    uint32_t m_profile = 0; // object type less one
    uint32_t m_frequencyIndex = 0;
    uint32_t m_channels = 0;
};

} // namespace tool

#endif
