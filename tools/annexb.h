// AVC frames of an FLV file as a byte stream (ISO/IEC 14496-10, annex B).
#ifndef FLVDMX_TOOLS_ANNEXB_H
#define FLVDMX_TOOLS_ANNEXB_H

#include <cstdint>
#include <vector>

namespace tool {

/** Puts start codes where the lengths were, and the parameter sets where a decoder needs them. */
class AnnexB {
public:
    /**
     * Takes an AVCDecoderConfigurationRecord, valid for the frames behind it.
     * @return false when it is damaged; the one before stays valid
     */
    bool Configure(const std::vector<uint8_t>& record);

    /**
     * Appends a frame to `out`: in front of the first one, and of the first keyframe after each change of the
     * configuration, its parameter sets.
     * @return false when a length does not fit the frame; what precedes it has been appended
     */
    bool Convert(const std::vector<uint8_t>& frame, bool keyframe, std::vector<uint8_t>& out);

private:
    std::vector<uint8_t> m_record;
    std::vector<uint8_t> m_parameterSets;
    uint32_t m_lengthSize = 0;
    bool m_begun = false;
    bool m_pending = false; // the parameter sets have not been written
};

} // namespace tool

#endif
