// The chain of tags.
#include "tools/chain.h"

#include <algorithm>
#include <cstdlib>
#include <utility>

#include <fmt/core.h>

#include "tools/text.h"

namespace tool {

Chain::Chain(const Input& input, TagReader& reader, Limits limits, Findings& findings, Progress progress)
    : m_reader(reader), m_limits(limits), m_findings(findings), m_progress(std::move(progress)),
      m_first(int64_t{input.Instance().data_offset} + BACK_POINTER_SIZE), m_times(limits.jumpMs)
{
}

void Chain::Walk()
{
    const int64_t begin = m_first - BACK_POINTER_SIZE;
    const uint8_t* const zeroth = m_reader.Bytes(begin, BACK_POINTER_SIZE);
    if (zeroth != nullptr && BigEndian(zeroth, BACK_POINTER_SIZE) != 0)
        m_findings.Add("back_pointer", "", begin,
                       fmt::format("the back-pointer before the first tag is {} instead of 0",
                                   BigEndian(zeroth, BACK_POINTER_SIZE)));
    for (int64_t position = m_first; position < m_reader.FileSize();) {
        m_progress(position);
        position = Step(position);
    }
    AddAlone(m_video);
    AddAlone(m_audio);
    if (m_limits.maxGapMs && m_video.time)
        CheckKeyframes(m_reader.FileSize(), *m_video.time);
}

// Most tags need a single read: the back-pointer and the next header are adjacent.
int64_t Chain::Step(int64_t position)
{
    const std::optional<Tag> tag = m_reader.At(position);
    if (!tag)
        return Resume(position, tag);
    if (IsChained(*tag)) {
        CheckPlayed(*tag);
        Take(*tag);
        return tag->End();
    }
    for (const int64_t next : {tag->End(), tag->DataEnd()}) {
        if (CouldFollow(next) || (next == tag->End() && next == m_reader.FileSize())) {
            TakeUnlinked(*tag, next);
            return next;
        }
    }
    return Resume(position, tag);
}

void Chain::CheckPlayed(const Tag& tag)
{
    const std::string why = m_reader.WhyNotPlayed(tag);
    if (why.empty())
        return;
    m_findings.Lose(tag.End() - tag.position);
    m_findings.Add("passed_over", why, tag.position, fmt::format("players skip this tag: {}", why));
}

bool Chain::IsChained(const Tag& tag)
{
    const uint8_t* const bytes = m_reader.Bytes(tag.DataEnd(), BACK_POINTER_SIZE);
    return bytes != nullptr && BigEndian(bytes, BACK_POINTER_SIZE) == TAG_HEADER_SIZE + tag.size;
}

// Without a back-pointer that confirms it, the next header must have a known type and StreamID 0, and its tag must be
// complete.
bool Chain::CouldFollow(int64_t position)
{
    const std::optional<Tag> next = m_reader.At(position);
    return next && next->DataEnd() <= m_reader.FileSize() && next->streamId == 0;
}

// Players skip such a tag, unless it is the first tag and has script data. Consecutive ones count as one cause.
void Chain::TakeUnlinked(const Tag& tag, int64_t next)
{
    const int64_t offset = tag.DataEnd();
    const uint8_t* const bytes = m_reader.Bytes(offset, BACK_POINTER_SIZE);
    if (tag.position != m_unlinkedEnd)
        m_unlinkedCause = std::to_string(tag.position);
    m_unlinkedEnd = next;
    if (next == offset)
        m_findings.Add("no_back_pointer", m_unlinkedCause, offset,
                       fmt::format("the tag at byte {} has no back-pointer", tag.position));
    else if (bytes != nullptr)
        m_findings.Add("back_pointer", m_unlinkedCause, offset,
                       fmt::format("the back-pointer of the tag at byte {} is {} instead of {}", tag.position,
                                   BigEndian(bytes, BACK_POINTER_SIZE), TAG_HEADER_SIZE + tag.size));
    if (tag.position != m_first || !tag.IsScript())
        m_findings.Lose(next - tag.position);
    Take(tag);
}

int64_t Chain::Resume(int64_t position, const std::optional<Tag>& tag)
{
    const std::optional<Tag> found = m_reader.Find(position + 1, m_reader.FileSize(), m_progress);
    if (!found) {
        AddRest(position, tag);
        return m_reader.FileSize();
    }
    const int64_t bytes = found->position - position;
    m_findings.Add("gap", "", position, fmt::format("{} bytes belong to no tag", bytes), {{"bytes", bytes}});
    m_findings.Lose(bytes);
    return found->position;
}

// No valid tag follows: the last one is cut short, or there are other bytes at the end.
void Chain::AddRest(int64_t position, const std::optional<Tag>& tag)
{
    const int64_t rest = m_reader.FileSize() - position;
    const uint8_t* const type = m_reader.Bytes(position, 1);
    const bool cutHeader =
        rest < TAG_HEADER_SIZE && type != nullptr &&
        (*type == FLVD_TAG_TYPE_AUDIO || *type == FLVD_TAG_TYPE_VIDEO || *type == FLVD_TAG_TYPE_SCRIPT);
    const bool cutTag = tag && tag->End() > m_reader.FileSize();
    m_findings.Lose(rest);
    m_findings.Add(cutHeader || cutTag ? "cut_short" : "gap", "", position,
                   cutHeader ? fmt::format("the last tag is cut short: {} bytes of its header", rest)
                   : cutTag  ? fmt::format("the last tag is cut short: {} of its {} bytes", rest, tag->End() - position)
                             : fmt::format("{} bytes after the last tag belong to no tag", rest),
                   {{"bytes", rest}});
}

void Chain::Take(const Tag& tag)
{
    ++m_tags;
    if (tag.IsConfig())
        CheckConfig(tag);
    if (!tag.IsFrame())
        return;
    CheckTime(tag);
    if (m_limits.maxGapMs)
        CheckGaps(tag);
}

void Chain::CheckConfig(const Tag& tag)
{
    const flvdmx::Bytes bytes = m_reader.ConfigBytes(tag);
    if (bytes.empty())
        return;
    std::vector<uint8_t>& config = LaneOf(tag).config;
    if (!config.empty() && !std::equal(config.begin(), config.end(), bytes.begin(), bytes.end()))
        m_findings.Note("configuration", tag.position,
                        fmt::format("the {} configuration changes", StreamName(tag.Stream())));
    config.assign(bytes.begin(), bytes.end());
}

void Chain::CheckTime(const Tag& tag)
{
    Lane& lane = LaneOf(tag);
    const Times::Step step = m_times.Take(tag.Stream(), tag.timestamp);
    const Jump here = {tag, std::exchange(lane.last, tag.timestamp)};
    const bool known = lane.odd.has_value();
    if (step == Times::Step::jump) {
        for (Lane* const each : {&m_video, &m_audio})
            if (const auto odd = std::exchange(each->odd, std::nullopt))
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
        m_findings.Note("pause", tag.position,
                        fmt::format("no {} frames from {} to {}", StreamName(tag.Stream()), FormatTime(here.from),
                                    FormatTime(tag.timestamp)));
}

// Where a recording was cut or restarted, both streams jump: that is one finding.
void Chain::AddJump(const Jump& jump)
{
    constexpr int64_t TOGETHER_MS = 1000;
    const int64_t to = jump.tag.timestamp;
    const bool same = m_jump && std::abs(m_jump->from - jump.from) < TOGETHER_MS &&
                      std::abs(int64_t{m_jump->tag.timestamp} - to) < TOGETHER_MS;
    m_jumpCause = same ? m_jumpCause : std::to_string(jump.tag.position);
    m_jump = jump;
    const char* const stream = StreamName(jump.tag.Stream());
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
    const char* const stream = StreamName(odd->tag.Stream());
    m_findings.Add("jump", "alone", odd->tag.position,
                   fmt::format("a single {} tag has the time {}, after one at {}", stream,
                               FormatTime(odd->tag.timestamp), FormatTime(odd->from)),
                   {{"stream", stream}, {"from_ms", odd->from}, {"to_ms", odd->tag.timestamp}});
}

void Chain::CheckKeyframes(int64_t position, int64_t time)
{
    if (m_keyframe && time - *m_keyframe > *m_limits.maxGapMs)
        m_findings.Add("keyframe_distance", "all", position,
                       fmt::format("no keyframe from {} to {}", FormatTime(*m_keyframe), FormatTime(time)));
    m_keyframe = time;
}

// Compares times that are continuous across jumps.
void Chain::CheckGaps(const Tag& tag)
{
    const int64_t time = m_times.Time();
    LaneOf(tag).time = time;
    if (tag.IsVideo() && !tag.IsExtended() && (tag.IsKeyframe() || !m_keyframe))
        CheckKeyframes(tag.position, time);
    if (!m_video.time || !m_audio.time)
        return;
    const int64_t lead = *m_audio.time - *m_video.time;
    if (std::abs(lead) > *m_limits.maxGapMs)
        m_findings.Add("interleaving", "all", tag.position,
                       fmt::format("audio is {} s {} video in the file", static_cast<double>(std::abs(lead)) / 1000,
                                   lead > 0 ? "ahead of" : "behind"));
}

} // namespace tool
