// What a check finds in a file.
#include "tools/chain.h"

#include <algorithm>
#include <cmath>
#include <cstdlib>
#include <cstring>
#include <utility>

#include <fmt/core.h>

#include "tools/report.h"

namespace tool {

namespace {

constexpr size_t MOST_LISTED = 1000;
constexpr uint32_t COUNT_SIZE = 4; // AMF0 strict array: the count is before the elements
constexpr uint32_t NUMBER_SIZE = 9;
constexpr uint8_t NUMBER_MARKER = 0;
constexpr double MOST_DIFFERENCE_MS = 1000;

uint32_t CountAt(TagReader& reader, int64_t elements)
{
    const uint8_t* const bytes = reader.Bytes(elements - COUNT_SIZE, COUNT_SIZE);
    return bytes == nullptr ? 0 : BigEndian(bytes, COUNT_SIZE);
}

std::optional<double> NumberAt(TagReader& reader, int64_t elements, uint32_t number)
{
    const uint8_t* const bytes = reader.Bytes(elements + int64_t{NUMBER_SIZE} * number, NUMBER_SIZE);
    if (bytes == nullptr || bytes[0] != NUMBER_MARKER)
        return std::nullopt;
    const uint64_t bits = uint64_t{BigEndian(bytes + 1, 4)} << 32 | BigEndian(bytes + 5, 4);
    double value = 0;
    std::memcpy(&value, &bits, sizeof value);
    return value;
}

std::string TimeText(double seconds)
{
    constexpr double MOST_SECONDS = 1e9;
    return std::abs(seconds) < MOST_SECONDS ? FormatTime(std::llround(seconds * 1000)) : fmt::format("{} s", seconds);
}

// What is wrong with an entry: the cause, which is the same for all entries with that fault, and the text.
struct Fault {
    const char* cause;
    std::string text;
};

std::optional<Fault> FaultOf(TagReader& reader, double seconds, double position)
{
    // Also true for NaN.
    if (!(position >= 0 && position < static_cast<double>(reader.FileSize())))
        return Fault{"outside", fmt::format("points to byte {:.15g}, which is not in the file", position)};
    const std::optional<Tag> tag = reader.At(static_cast<int64_t>(position));
    // The first entry may point to the configuration instead of the first keyframe.
    if (!tag || !(IsVideoKeyframe(*tag) || (tag->is_avc() && tag->is_config())))
        return Fault{"position", fmt::format("points to byte {:.15g}, where there is no keyframe", position)};
    if (!(std::abs(seconds * 1000 - tag->timestamp()) <= MOST_DIFFERENCE_MS))
        return Fault{"time", fmt::format("states {}, but the keyframe at byte {:.15g} has {}", TimeText(seconds),
                                         position, FormatTime(tag->timestamp()))};
    return std::nullopt;
}

} // namespace

void Findings::Add(const char* kind, const std::string& cause, int64_t offset, const std::string& text,
                   const Json& more)
{
    m_counts[kind] = m_counts.value(kind, uint64_t{0}) + 1;
    if (Enter(m_list, kind, cause, offset, text, more))
        ++m_total;
}

void Findings::Note(const char* kind, const std::string& cause, int64_t offset, const std::string& text)
{
    Enter(m_notes, kind, cause, offset, text, Json::object());
}

// Returns false if an earlier entry has the same cause.
bool Findings::Enter(Json& list, const char* kind, const std::string& cause, int64_t offset, const std::string& text,
                     const Json& more)
{
    const std::string key = std::string(kind) + ' ' + cause;
    if (const auto known = m_causes.find(key); known != m_causes.end()) {
        Json& entry = list[known->second];
        entry["count"] = entry["count"].get<uint64_t>() + 1;
        entry["last_offset"] = offset;
        return false;
    }
    if (list.size() >= MOST_LISTED)
        return true;
    if (!cause.empty())
        m_causes[key] = list.size();
    Json entry = {{"kind", kind}, {"offset", offset}, {"count", 1}};
    entry.update(more);
    entry["text"] = text;
    list.push_back(entry);
    return true;
}

void Findings::WriteTo(Json& object, int64_t lost) const
{
    object["sound"] = m_total == 0;
    object["lost_bytes"] = lost;
    object["counts"] = m_counts;
    object["findings"] = m_list;
    object["unlisted"] = m_total - m_list.size();
    object["notes"] = m_notes;
}

Chain::Chain(Played& played, Limits limits, Findings& findings)
    : m_played(played), m_reader(played.Reader()), m_limits(limits), m_findings(findings), m_times(limits.jumpMs)
{
}

void Chain::Walk()
{
    const int64_t begin = m_reader.FirstTag() - Tag::back_pointer_size;
    const uint8_t* const zeroth = m_reader.Bytes(begin, Tag::back_pointer_size);
    const uint32_t size = zeroth != nullptr ? BigEndian(zeroth, Tag::back_pointer_size) : 0;
    if (size != 0)
        m_findings.Add("back_pointer", "", begin,
                       fmt::format("the back-pointer before the first tag is {} instead of 0", size));
    m_reader.Walk(m_reader.FirstTag(), m_reader.FileSize(), [this](const Part& part) {
        See(part);
        return true;
    });
    for (Lane& lane : m_lanes)
        AddAlone(lane);
    if (m_limits.maxGapMs && m_lanes[0].time)
        CheckKeyframes(m_reader.FileSize(), *m_lanes[0].time);
}

void Chain::See(const Part& part)
{
    const bool skipped = m_played.CountIfSkipped(part);
    if (part.kind == Part::Kind::damage)
        return AddDamage(part);
    if (part.kind == Part::Kind::unlinked)
        AddUnlinked(part);
    else if (skipped)
        AddSkipped(part.tag);
    Take(part.tag);
}

void Chain::AddSkipped(const Tag& tag)
{
    const std::string why = m_played.WhyNot(tag);
    m_findings.Add("passed_over", why, tag.position, fmt::format("players skip this tag: {}", why));
}

// Consecutive tags without a valid back-pointer count as one cause.
void Chain::AddUnlinked(const Part& part)
{
    const Tag& tag = part.tag;
    if (tag.position != m_unlinkedEnd)
        m_unlinkedCause = std::to_string(tag.position);
    m_unlinkedEnd = part.end;
    if (part.end == tag.data_end())
        m_findings.Add("no_back_pointer", m_unlinkedCause, tag.data_end(),
                       fmt::format("the tag at byte {} has no back-pointer", tag.position));
    else if (const uint8_t* const bytes = m_reader.Bytes(tag.data_end(), Tag::back_pointer_size); bytes != nullptr)
        m_findings.Add("back_pointer", m_unlinkedCause, tag.data_end(),
                       fmt::format("the back-pointer of the tag at byte {} is {} instead of {}", tag.position,
                                   BigEndian(bytes, Tag::back_pointer_size), Tag::header_size + tag.data_size()));
}

// At the end of the file, the last tag is cut short, or there are other bytes.
void Chain::AddDamage(const Part& part)
{
    const int64_t bytes = part.Size();
    const bool last = part.end == m_reader.FileSize();
    const uint8_t* const type = m_reader.Bytes(part.begin, 1);
    const bool cutHeader =
        last && bytes < Tag::header_size && type != nullptr &&
        (*type == FLVD_TAG_TYPE_AUDIO || *type == FLVD_TAG_TYPE_VIDEO || *type == FLVD_TAG_TYPE_SCRIPT);
    const bool cutTag = last && part.tag.position >= 0 && part.tag.end() > part.end;
    m_findings.Add(
        cutHeader || cutTag ? "cut_short" : "gap", "", part.begin,
        cutHeader ? fmt::format("the last tag is cut short: {} bytes of its header", bytes)
        : cutTag  ? fmt::format("the last tag is cut short: {} of its {} bytes", bytes, part.tag.end() - part.begin)
        : last    ? fmt::format("{} bytes after the last tag belong to no tag", bytes)
                  : fmt::format("{} bytes belong to no tag", bytes),
        {{"bytes", bytes}});
}

void Chain::Take(const Tag& tag)
{
    ++m_tags;
    if (tag.is_config())
        CheckConfig(tag);
    if (!tag.has_frame())
        return;
    CheckTime(tag);
    if (m_limits.maxGapMs)
        CheckGaps(tag);
}

void Chain::CheckConfig(const Tag& tag)
{
    std::vector<uint8_t> bytes = m_reader.Config(tag);
    if (bytes.empty())
        return;
    std::vector<uint8_t>& config = LaneOf(tag).config;
    if (!config.empty() && config != bytes)
        m_findings.Note("configuration", StreamName(tag.stream()), tag.position,
                        fmt::format("the {} configuration changes", StreamName(tag.stream())));
    config = std::move(bytes);
}

void Chain::CheckTime(const Tag& tag)
{
    Lane& lane = LaneOf(tag);
    const Times::Step step = m_times.Take(tag.stream(), tag.timestamp());
    const Jump here = {tag, std::exchange(lane.last, tag.timestamp())};
    const bool known = lane.odd.has_value();
    if (step == Times::Step::jump) {
        for (Lane& each : m_lanes)
            if (const auto odd = std::exchange(each.odd, std::nullopt))
                AddJump(*odd);
        if (!known)
            AddJump(here);
        return;
    }
    if (step == Times::Step::pause)
        lane.odd.reset();
    AddAlone(lane); // the odd tag was not followed by a jump
    if (step == Times::Step::odd)
        lane.odd = here;
    else if (step == Times::Step::back || (step == Times::Step::alone && !known))
        AddJump(here);
    else if (step == Times::Step::pause)
        m_findings.Note("pause", StreamName(tag.stream()), tag.position,
                        fmt::format("no {} frames from {} to {}", StreamName(tag.stream()), FormatTime(here.from),
                                    FormatTime(tag.timestamp())));
}

// Where a recording was cut or restarted, both streams jump: that is one finding.
void Chain::AddJump(const Jump& jump)
{
    constexpr int64_t TOGETHER_MS = 1000;
    const int64_t to = jump.tag.timestamp();
    const bool same = m_jump && std::abs(m_jump->from - jump.from) < TOGETHER_MS &&
                      std::abs(int64_t{m_jump->tag.timestamp()} - to) < TOGETHER_MS;
    m_jumpCause = same ? m_jumpCause : std::to_string(jump.tag.position);
    m_jump = jump;
    const char* const stream = StreamName(jump.tag.stream());
    m_findings.Add("jump", m_jumpCause, jump.tag.position,
                   fmt::format("{} time jumps {} from {} to {}", stream, to < jump.from ? "back" : "forward",
                               FormatTime(jump.from), FormatTime(to)),
                   {{"stream", stream}, {"from_ms", jump.from}, {"to_ms", to}});
}

void Chain::AddAlone(Lane& lane)
{
    const std::optional<Jump> odd = std::exchange(lane.odd, std::nullopt);
    if (!odd)
        return;
    const char* const stream = StreamName(odd->tag.stream());
    m_findings.Add("jump", "alone", odd->tag.position,
                   fmt::format("a single {} tag has the time {}, after one at {}", stream,
                               FormatTime(odd->tag.timestamp()), FormatTime(odd->from)),
                   {{"stream", stream}, {"from_ms", odd->from}, {"to_ms", odd->tag.timestamp()}});
}

void Chain::CheckKeyframes(int64_t position, int64_t time)
{
    if (m_keyframe && time - *m_keyframe > *m_limits.maxGapMs)
        m_findings.Add("keyframe_distance", "all", position,
                       fmt::format("no keyframe between {} and {}", FormatTime(*m_keyframe), FormatTime(time)));
    m_keyframe = time;
}

// Compares times that are continuous across jumps.
void Chain::CheckGaps(const Tag& tag)
{
    const int64_t time = m_times.Time();
    LaneOf(tag).time = time;
    if (tag.is_video() && !tag.is_enhanced() && (tag.is_keyframe() || !m_keyframe))
        CheckKeyframes(tag.position, time);
    if (!m_lanes[0].time || !m_lanes[1].time)
        return;
    const int64_t lead = *m_lanes[1].time - *m_lanes[0].time;
    if (std::abs(lead) > *m_limits.maxGapMs)
        m_findings.Add("interleaving", "all", tag.position,
                       fmt::format("audio is {} s {} video in the file", static_cast<double>(std::abs(lead)) / 1000,
                                   lead > 0 ? "ahead of" : "behind"));
}

void CheckIndex(const Input& input, TagReader& reader, Findings& findings)
{
    const flvd_keyframe_index_t& index = input.Instance().keyframe_index;
    if (index.times_offset == 0 && index.positions_offset == 0)
        return;
    if (index.times_offset == 0 || index.positions_offset == 0) {
        findings.Add("index", "", std::max(index.times_offset, index.positions_offset),
                     fmt::format("the keyframe index has no {}", index.times_offset == 0 ? "times" : "positions"));
        return;
    }
    const uint32_t times = CountAt(reader, index.times_offset);
    const uint32_t positions = CountAt(reader, index.positions_offset);
    if (times != positions)
        findings.Add("index", "", index.positions_offset,
                     fmt::format("the keyframe index has {} times and {} positions", times, positions));
    for (uint32_t i = 0; i < std::min(times, positions); ++i) {
        const int64_t offset = index.positions_offset + int64_t{NUMBER_SIZE} * i;
        const std::optional<double> time = NumberAt(reader, index.times_offset, i);
        const std::optional<double> position = NumberAt(reader, index.positions_offset, i);
        if (!time || !position) { // the array ends before its stated length
            findings.Add("index", "", offset, fmt::format("index entry {} is not a number", i + 1), {{"entry", i + 1}});
            return;
        }
        if (const std::optional<Fault> fault = FaultOf(reader, *time, *position))
            findings.Add("index", fault->cause, offset, fmt::format("index entry {} {}", i + 1, fault->text),
                         {{"entry", i + 1}});
    }
}

} // namespace tool
