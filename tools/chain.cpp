// The chain of tags.
#include "tools/chain.h"

#include <utility>

#include <fmt/core.h>

#include "tools/time_text.h"

namespace tool {

namespace {

bool IsTagType(uint32_t type)
{
    return type == FLVD_TAG_TYPE_AUDIO || type == FLVD_TAG_TYPE_VIDEO || type == FLVD_TAG_TYPE_SCRIPT;
}

int64_t SizeOf(fio_file_t* reader)
{
    return __FLV_DMX__fioSeek64(reader, 0, FIO_SEEK_END) == 0 ? __FLV_DMX__fioTell64(reader) : 0;
}

} // namespace

TagProbe::TagProbe(const Demuxer& demuxer)
    : m_reader(demuxer.Reader(FLVD_STREAM_VIDEO)), m_fileSize(SizeOf(demuxer.Reader(FLVD_STREAM_VIDEO)))
{
}

const uint8_t* TagProbe::Bytes(int64_t position, uint32_t size) const
{
    const uint8_t* bytes = nullptr;
    if (position < 0 || position > m_fileSize || size > m_fileSize - position ||
        __FLV_DMX__fioSeek64(m_reader, position, FIO_SEEK_SET) != 0)
        return nullptr;
    return __FLV_DMX__fioShowBytesByPtr(&bytes, size, m_reader) == size ? bytes : nullptr;
}

std::optional<Tag> TagProbe::At(int64_t position) const
{
    constexpr uint32_t WITH_CODEC = TAG_HEADER_SIZE + 2;
    const uint8_t* bytes = Bytes(position, WITH_CODEC);
    const uint32_t available = bytes != nullptr ? WITH_CODEC : TAG_HEADER_SIZE;
    if (bytes == nullptr)
        bytes = Bytes(position, TAG_HEADER_SIZE);
    if (bytes == nullptr || !IsTagType(bytes[0]))
        return std::nullopt;
    return Tag::Parse(position, bytes, available);
}

Chain::Chain(const Demuxer& demuxer, const TagProbe& probe, uint32_t jumpMs, Findings& findings, Progress progress)
    : m_instance(demuxer.Instance()), m_reader(demuxer.Reader(FLVD_STREAM_VIDEO)), m_streams(demuxer.Streams()),
      m_probe(probe), m_jumpMs(jumpMs), m_findings(findings), m_progress(std::move(progress)),
      m_first(m_instance->data_offset + int64_t{BACK_POINTER_SIZE})
{
}

void Chain::Walk()
{
    const uint8_t* const zeroth = m_probe.Bytes(m_instance->data_offset, BACK_POINTER_SIZE);
    if (zeroth != nullptr && BigEndian(zeroth, BACK_POINTER_SIZE) != 0)
        m_findings.Add("back_pointer", m_instance->data_offset,
                       fmt::format("the back-pointer in front of the first tag is {} instead of 0",
                                   BigEndian(zeroth, BACK_POINTER_SIZE)));
    for (int64_t position = m_first; position < m_probe.FileSize();) {
        m_progress(position);
        position = Step(position);
    }
}

// One step costs one read for most tags: the back-pointer and the next header lie together.
int64_t Chain::Step(int64_t position)
{
    const std::optional<Tag> tag = m_probe.At(position);
    if (!tag)
        return Resume(position, tag);
    if (IsChained(*tag)) {
        JudgePlayed(*tag);
        Take(*tag);
        return tag->End();
    }
    for (const int64_t next : {tag->End(), tag->DataEnd()}) {
        if (CouldFollow(next) || (next == tag->End() && next == m_probe.FileSize())) {
            TakeUnlinked(*tag, next);
            return next;
        }
    }
    return Resume(position, tag);
}

// Why a player passes over a tag of which the chain holds; empty when it does not.
std::string_view Chain::WhyPassedOver(const Tag& tag) const
{
    if (tag.type == FLVD_TAG_TYPE_SCRIPT)
        return "";
    if ((m_streams & tag.Stream()) == 0)
        return "are of a stream that cannot be played";
    const bool sameCodec = tag.IsVideo() ? ((tag.codec ^ m_instance->video_codec_filter) & CODEC_ID_MASK) == 0 &&
                                               tag.codec >> 4 <= MOST_FRAME_TYPE
                                         : tag.codec == m_instance->audio_format_filter;
    if (!sameCodec)
        return "are of another codec than the stream";
    if (m_instance->last_ts != 0 && tag.timestamp > m_instance->last_ts)
        return "are later than the last ones of the file";
    return tag.size < tag.CodecHeaderSize() ? "are too short for a frame" : "";
}

// One finding for all tags in a row.
void Chain::JudgePlayed(const Tag& tag)
{
    const std::string_view why = WhyPassedOver(tag);
    if (!why.empty())
        m_findings.Lose(tag.End() - tag.position);
    if (!why.empty() && why != m_passedOver)
        m_findings.Add("passed_over", tag.position, fmt::format("tags from here on {}", why));
    if (tag.type != FLVD_TAG_TYPE_SCRIPT)
        m_passedOver = why;
}

bool Chain::IsChained(const Tag& tag) const
{
    const uint8_t* const bytes = m_probe.Bytes(tag.DataEnd(), BACK_POINTER_SIZE);
    return bytes != nullptr && BigEndian(bytes, BACK_POINTER_SIZE) == TAG_HEADER_SIZE + tag.size;
}

// Without a back-pointer to confirm it the next header must be beyond doubt: type, StreamID 0, and whole.
bool Chain::CouldFollow(int64_t position) const
{
    constexpr uint32_t STREAM_ID_OFFSET = 8;
    const std::optional<Tag> next = m_probe.At(position);
    if (!next || next->DataEnd() > m_probe.FileSize())
        return false;
    const uint8_t* const bytes = m_probe.Bytes(position, TAG_HEADER_SIZE);
    return bytes != nullptr && BigEndian(bytes + STREAM_ID_OFFSET, 3) == 0;
}

// A player passes such a tag over, unless it is the first script tag.
void Chain::TakeUnlinked(const Tag& tag, int64_t next)
{
    const int64_t offset = tag.DataEnd();
    const uint8_t* const bytes = m_probe.Bytes(offset, BACK_POINTER_SIZE);
    if (next == offset)
        m_findings.Add("no_back_pointer", offset, fmt::format("the tag at byte {} has no back-pointer", tag.position));
    else if (bytes != nullptr)
        m_findings.Add("back_pointer", offset,
                       fmt::format("the back-pointer of the tag at byte {} is {} instead of {}", tag.position,
                                   BigEndian(bytes, BACK_POINTER_SIZE), TAG_HEADER_SIZE + tag.size));
    if (tag.position != m_first || tag.type != FLVD_TAG_TYPE_SCRIPT)
        m_findings.Lose(next - tag.position);
    Take(tag);
}

int64_t Chain::Resume(int64_t position, const std::optional<Tag>& tag)
{
    const auto found = FindTag(m_instance, m_reader, position + 1, m_probe.FileSize(), m_progress);
    if (!found) {
        AddRest(position, tag);
        return m_probe.FileSize();
    }
    const int64_t bytes = *found - position;
    m_findings.Add("gap", position, fmt::format("{} bytes belong to no tag", bytes), {{"bytes", bytes}});
    m_findings.Lose(bytes);
    return *found;
}

// The end of the file holds no tag any more: its last one was cut off, or something else follows.
void Chain::AddRest(int64_t position, const std::optional<Tag>& tag)
{
    const int64_t rest = m_probe.FileSize() - position;
    const uint8_t* const type = m_probe.Bytes(position, 1);
    const bool cutHeader = rest < TAG_HEADER_SIZE && type != nullptr && IsTagType(*type);
    m_findings.Lose(rest);
    if (cutHeader)
        m_findings.Add("cut_short", position, fmt::format("the last tag is cut short: {} bytes of its header", rest),
                       {{"bytes", rest}});
    else if (tag && tag->End() > m_probe.FileSize())
        m_findings.Add("cut_short", position,
                       fmt::format("the last tag is cut short: {} of its {} bytes", rest, tag->End() - position),
                       {{"bytes", rest}});
    else
        m_findings.Add("gap", position, fmt::format("{} bytes behind the last tag belong to no tag", rest),
                       {{"bytes", rest}});
}

void Chain::Take(const Tag& tag)
{
    ++m_tags;
    if (!tag.IsFrame())
        return;
    std::optional<uint32_t>& last = m_lastTimes[tag.Stream()];
    const bool back = last && tag.timestamp < *last;
    if (last && (back || tag.timestamp - *last > m_jumpMs))
        m_findings.Add("jump", tag.position,
                       fmt::format("{} time jumps {} from {} to {}", StreamName(tag.Stream()),
                                   back ? "back" : "forward", FormatTime(*last), FormatTime(tag.timestamp)),
                       {{"stream", StreamName(tag.Stream())}, {"from_ms", *last}, {"to_ms", tag.timestamp}});
    last = tag.timestamp;
}

} // namespace tool
