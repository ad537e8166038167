// What a check finds in a file.
#ifndef FLVDMX_TOOLS_FINDINGS_H
#define FLVDMX_TOOLS_FINDINGS_H

#include <cstdint>
#include <map>
#include <string>

#include "tools/report.h"

namespace tool {

/** One finding per cause, with a count. Only the first ones are kept, which limits the memory for a very damaged file.
 */
class Findings {
public:
    /**
     * @param kind   name of the kind, such as "gap"
     * @param cause  findings of one kind with the same cause are combined; empty: not combined with others
     * @param offset position in the file
     * @param text   description for people
     * @param more   further members for programs
     */
    void Add(const char* kind, const std::string& cause, int64_t offset, const std::string& text,
             const Json& more = Json::object());

    /** Adds something that is worth knowing but is not a fault. */
    void Note(const char* kind, int64_t offset, const std::string& text);

    /** Counts bytes that are not played. */
    void Lose(int64_t bytes) { m_lost += bytes; }

    /** Adds the members sound, lost_bytes, counts, findings, unlisted and notes. */
    void WriteTo(Json& object) const;

private:
    uint64_t m_total = 0; // findings, combined ones counted once
    int64_t m_lost = 0;
    Json m_counts = Json::object();
    Json m_list = Json::array();
    Json m_notes = Json::array();
    std::map<std::string, size_t> m_causes; // index in the list
};

} // namespace tool

#endif
