// What was found wrong with a file.
#ifndef FLVDMX_TOOLS_FINDINGS_H
#define FLVDMX_TOOLS_FINDINGS_H

#include <cstdint>
#include <string>

#include "tools/report.h"

namespace tool {

/** Counts all findings and keeps the first ones, so that a ruined file takes no more memory than a sound one. */
class Findings {
public:
    /**
     * @param kind   word for the kind, such as "gap"
     * @param offset where in the file
     * @param text   for people
     * @param more   members for programs
     */
    void Add(const char* kind, int64_t offset, const std::string& text, const Json& more = Json::object());

    /** Bytes that are not played. */
    void Lose(int64_t bytes) { m_lost += bytes; }

    /** Puts sound, lost_bytes, counts, findings and unlisted into the object. */
    void WriteTo(Json& object) const;

private:
    uint64_t m_total = 0;
    int64_t m_lost = 0;
    Json m_counts = Json::object();
    Json m_list = Json::array();
};

} // namespace tool

#endif
