// What a check finds in a file.
#include "tools/findings.h"

namespace tool {

namespace {

constexpr size_t MOST_LISTED = 1000;

} // namespace

void Findings::Add(const char* kind, const std::string& cause, int64_t offset, const std::string& text,
                   const Json& more)
{
    m_counts[kind] = m_counts.value(kind, uint64_t{0}) + 1;
    const std::string key = std::string(kind) + ' ' + cause;
    if (const auto known = m_causes.find(key); known != m_causes.end()) {
        Json& finding = m_list[known->second];
        finding["count"] = finding["count"].get<uint64_t>() + 1;
        finding["last_offset"] = offset;
        return;
    }
    ++m_total;
    if (m_list.size() >= MOST_LISTED)
        return;
    if (!cause.empty())
        m_causes[key] = m_list.size();
    Json finding = {{"kind", kind}, {"offset", offset}, {"count", 1}};
    finding.update(more);
    finding["text"] = text;
    m_list.push_back(finding);
}

void Findings::Note(const char* kind, int64_t offset, const std::string& text)
{
    if (m_notes.size() < MOST_LISTED)
        m_notes.push_back({{"kind", kind}, {"offset", offset}, {"text", text}});
}

void Findings::WriteTo(Json& object) const
{
    object["sound"] = m_total == 0;
    object["lost_bytes"] = m_lost;
    object["counts"] = m_counts;
    object["findings"] = m_list;
    object["unlisted"] = m_total - m_list.size();
    object["notes"] = m_notes;
}

} // namespace tool
