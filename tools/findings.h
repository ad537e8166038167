// What was found wrong with a file.
#ifndef FLVDMX_TOOLS_FINDINGS_H
#define FLVDMX_TOOLS_FINDINGS_H

#include <cstdint>
#include <map>
#include <string>

#include "tools/report.h"

namespace tool {

/** One finding per cause, with a count. Keeps the first ones, so that a ruined file takes no more memory than a valid
 *  one. */
class Findings {
public:
    /**
     * @param kind   word for the kind, such as "gap"
     * @param cause  findings of one kind with the same cause are one; empty: this one is on its own
     * @param offset where in the file
     * @param text   for people
     * @param more   members for programs
     */
    void Add(const char* kind, const std::string& cause, int64_t offset, const std::string& text,
             const Json& more = Json::object());

    /** Something worth knowing that is no fault. */
    void Note(const char* kind, int64_t offset, const std::string& text);

    /** Bytes that are not played. */
    void Lose(int64_t bytes) { m_lost += bytes; }

    /** Puts sound, lost_bytes, counts, findings, unlisted and notes into the object. */
    void WriteTo(Json& object) const;

private:
    uint64_t m_total = 0; // findings, each counted once
    int64_t m_lost = 0;
    Json m_counts = Json::object();
    Json m_list = Json::array();
    Json m_notes = Json::array();
    std::map<std::string, size_t> m_causes; // place in the list
};

} // namespace tool

#endif
