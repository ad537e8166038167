// What was found wrong with a file.
#include "tools/findings.h"

namespace tool {

namespace {

constexpr size_t MOST_LISTED = 1000;

} // namespace

void Findings::Add(const char* kind, int64_t offset, const std::string& text, const Json& more)
{
    ++m_total;
    m_counts[kind] = m_counts.value(kind, uint64_t{0}) + 1;
    if (m_list.size() >= MOST_LISTED)
        return;
    Json finding = {{"kind", kind}, {"offset", offset}};
    finding.update(more);
    finding["text"] = text;
    m_list.push_back(finding);
}

void Findings::WriteTo(Json& object) const
{
    object["sound"] = m_total == 0;
    object["lost_bytes"] = m_lost;
    object["counts"] = m_counts;
    object["findings"] = m_list;
    object["unlisted"] = m_total - m_list.size();
}

} // namespace tool
