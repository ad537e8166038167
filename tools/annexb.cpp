// AVC frames as a byte stream.
#include "tools/annexb.h"

#include "flvdmx/flvdmx.h"
#include "tools/tags.h"

namespace tool {

namespace {

constexpr uint8_t START_CODE[] = {0, 0, 0, 1};
constexpr size_t LEAST_RECORD_SIZE = 7;
constexpr size_t LENGTH_SIZE_OFFSET = 4; // of lengthSizeMinusOne, two bits

// A start code takes two bytes more than the length of a parameter set, and no set is shorter than its length.
std::vector<uint8_t> ParameterSets(const std::vector<uint8_t>& record)
{
    std::vector<uint8_t> sets(2 * record.size());
    const int32_t size = FLVD_GetAVCSeqHeaderFromAvcC(record.data(), static_cast<int32_t>(record.size()), sets.data(),
                                                      static_cast<int32_t>(sets.size()));
    sets.resize(size > 0 ? static_cast<size_t>(size) : 0);
    return sets;
}

} // namespace

bool AnnexB::Configure(const std::vector<uint8_t>& record)
{
    if (record == m_record)
        return true;
    if (record.size() < LEAST_RECORD_SIZE)
        return false;
    const uint32_t lengthSize = (record[LENGTH_SIZE_OFFSET] & 3U) + 1;
    std::vector<uint8_t> sets = ParameterSets(record);
    if (lengthSize == 3 || sets.empty())
        return false;
    m_record = record;
    m_parameterSets = std::move(sets);
    m_lengthSize = lengthSize;
    m_pending = true;
    return true;
}

bool AnnexB::Convert(const std::vector<uint8_t>& frame, bool keyframe, std::vector<uint8_t>& out)
{
    if (m_pending && (keyframe || !m_begun)) {
        out.insert(out.end(), m_parameterSets.begin(), m_parameterSets.end());
        m_pending = false;
    }
    m_begun = true;
    for (size_t pos = 0; pos < frame.size();) {
        if (m_lengthSize == 0 || m_lengthSize > frame.size() - pos)
            return false;
        const uint32_t length = BigEndian(&frame[pos], m_lengthSize);
        pos += m_lengthSize;
        if (length > frame.size() - pos)
            return false;
        if (length > 0) {
            out.insert(out.end(), std::begin(START_CODE), std::end(START_CODE));
            out.insert(out.end(), frame.data() + pos, frame.data() + pos + length);
        }
        pos += length;
    }
    return true;
}

} // namespace tool
