// The tags of a file.
#include "tools/tags.h"

#include <algorithm>
#include <array>
#include <string_view>

#include <fmt/core.h>

#include "tools/report.h"
#include "tools/text.h"

namespace tool {

namespace {

constexpr uint32_t READER_CACHE = 4096; // a larger one would bypass the host's read-ahead window
constexpr uint32_t BYTES_WITH_CODEC = TAG_HEADER_SIZE + 2;

// As the library tests the first configuration, without which it does not find an AVC stream.
bool IsValidAvcConfig(flvdmx::Bytes record)
{
    constexpr auto AVC = static_cast<int32_t>(flvdmx::VideoCodec::avc);
    std::array<uint8_t, MOST_SET_BYTES> sets{};
    flvd_video_info_t picture{};
    const int32_t size = FLVD_GetAVCSeqHeaderFromAvcC(record.data(), static_cast<int32_t>(record.size()), sets.data(),
                                                      int32_t{MOST_SET_BYTES});
    return size > 0 && FLVD_ParseVideoHeader(AVC, sets.data(), size, &picture) == 0;
}

} // namespace

TagReader::TagReader(const Input& input)
    : m_input(input), m_instance(input.file.instance()),
      m_reader(__FLV_DMX__fioOpen(PathOf(input.name).c_str(), FIO_MODE_READ | FIO_MODE_BINARY, READER_CACHE, 0, 0))
{
    if (m_reader == nullptr)
        throw FileError(input.name, "cannot be opened a second time");
    if (__FLV_DMX__fioSeek64(m_reader.get(), 0, FIO_SEEK_END) == 0)
        m_fileSize = __FLV_DMX__fioTell64(m_reader.get());
}

const uint8_t* TagReader::Bytes(int64_t position, uint32_t size)
{
    const uint8_t* bytes = nullptr;
    if (position < 0 || position > m_fileSize || size > m_fileSize - position ||
        __FLV_DMX__fioSeek64(m_reader.get(), position, FIO_SEEK_SET) != 0)
        return nullptr;
    return __FLV_DMX__fioShowBytesByPtr(&bytes, size, m_reader.get()) == size ? bytes : nullptr;
}

std::optional<Tag> TagReader::At(int64_t position)
{
    const uint8_t* bytes = Bytes(position, BYTES_WITH_CODEC);
    const uint32_t available = bytes != nullptr ? BYTES_WITH_CODEC : TAG_HEADER_SIZE;
    if (bytes == nullptr)
        bytes = Bytes(position, TAG_HEADER_SIZE);
    if (bytes == nullptr)
        return std::nullopt;
    const Tag tag = Tag::Parse(position, bytes, available);
    return tag.HasKnownType() ? std::optional(tag) : std::nullopt;
}

std::optional<Tag> TagReader::Find(int64_t from, int64_t end, const std::function<void(int64_t)>& progress)
{
    constexpr uint32_t ALL_KINDS = FLVD_TAG_VIDEO | FLVD_TAG_AUDIO | FLVD_TAG_SCRIPT;
    int64_t reached = from - 1;
    if (__FLV_DMX__fioSeek64(m_reader.get(), from, FIO_SEEK_SET) != 0)
        return std::nullopt;
    for (;;) {
        flvd_tag_info_t info{};
        const int32_t result = FLVD_GetCurrTagInfo(m_instance, m_reader.get(), &info, ALL_KINDS, 1 /* verify */);
        const int64_t position = __FLV_DMX__fioTell64(m_reader.get());
        if (result == 0)
            return position < end ? At(position) : std::nullopt;
        if (position <= reached || position >= end)
            return std::nullopt;
        reached = position;
        if (progress)
            progress(reached);
    }
}

flvdmx::Bytes TagReader::ConfigBytes(const Tag& tag)
{
    const uint32_t size = tag.size - std::min(tag.size, tag.CodecHeaderSize());
    const uint8_t* const bytes = Bytes(tag.position + TAG_HEADER_SIZE + tag.CodecHeaderSize(), size);
    return {bytes, bytes != nullptr ? size : 0};
}

std::optional<Tag> TagReader::FindConfig(flvdmx::Stream stream)
{
    int64_t position = int64_t{m_instance->data_offset} + BACK_POINTER_SIZE;
    while (const std::optional<Tag> tag = Find(position, m_fileSize)) {
        position = tag->End();
        if (tag->IsScript() || tag->Stream() != stream || tag->size == 0)
            continue;
        if (!tag->IsAvc() && !tag->IsAac())
            break;
        const flvdmx::Bytes config = tag->IsConfig() ? ConfigBytes(*tag) : flvdmx::Bytes();
        if (config.size() > 1 && (tag->IsAac() || IsValidAvcConfig(config)))
            return tag;
    }
    return std::nullopt;
}

// FLAGS of the file header (FLV file format, version 10.1, annex E.2).
uint32_t TagReader::AnnouncedStreams()
{
    constexpr uint32_t FLAGS_OFFSET = 4;
    constexpr uint8_t VIDEO_FLAG = 0x01;
    constexpr uint8_t AUDIO_FLAG = 0x04;
    const uint8_t* const bytes = Bytes(FLAGS_OFFSET, 1);
    const uint8_t flags = bytes != nullptr ? *bytes : 0;
    return ((flags & VIDEO_FLAG) != 0 ? uint32_t{FLVD_STREAM_VIDEO} : 0) |
           ((flags & AUDIO_FLAG) != 0 ? uint32_t{FLVD_STREAM_AUDIO} : 0);
}

std::string TagReader::WhyNotPlayed(const Tag& tag)
{
    if (tag.IsScript())
        return "";
    const char* const stream = StreamName(tag.Stream());
    const std::string& none = WhyNoStream(tag.Stream());
    if (!m_input.Has(tag.Stream()))
        return fmt::format("the {} is not played{}{}", stream, none.empty() ? "" : ": ", none);
    return tag.size == 0 ? "it is empty" : WhyNotInStream(tag);
}

std::string TagReader::WhyNotInStream(const Tag& tag)
{
    const char* const stream = StreamName(tag.Stream());
    const uint8_t* const bytes = Bytes(tag.position + TAG_HEADER_SIZE + 1, FOURCC_SIZE);
    const std::string_view fourcc(reinterpret_cast<const char*>(bytes), bytes != nullptr ? FOURCC_SIZE : 0);
    const bool sameCodec =
        tag.IsVideo() ? tag.VideoCodec() == m_input.info.video->codec : tag.AudioCodec() == m_input.info.audio->codec;
    if (tag.IsVideo() && tag.codec >> 4 > MOST_FRAME_TYPE && !IsEnhanced(tag, fourcc))
        return fmt::format("its codec byte is invalid: 0x{:02x}", tag.codec);
    if (!sameCodec || tag.IsExtended())
        return fmt::format("it has another codec than the {} stream: {}", stream, CodecOf(tag, fourcc));
    if (tag.IsAudio() && tag.codec != m_instance->audio_format_filter)
        return fmt::format("it has another codec byte than the audio stream: 0x{:02x} instead of 0x{:02x}", tag.codec,
                           m_instance->audio_format_filter & 0xFF);
    if (m_instance->last_ts != 0 && tag.timestamp > m_instance->last_ts)
        return "it is later than the last timestamp of the file";
    return tag.size < tag.CodecHeaderSize() ? "it is too short for a frame" : "";
}

const std::string& TagReader::WhyNoStream(flvdmx::Stream stream)
{
    std::optional<std::string>& reason = stream == flvdmx::Stream::video ? m_noVideo : m_noAudio;
    if (!reason)
        reason = m_input.Has(stream) ? "" : tool::WhyNoStream(PathOf(m_input.name), stream);
    return *reason;
}

// AVC needs no check here: without its configuration, the stream is not found at all.
std::string ConfigFault(const Input& input)
{
    const bool missing =
        input.info.audio && input.info.audio->codec == flvdmx::AudioCodec::aac && input.info.audio->config.empty();
    return missing ? "the audio does not start with its AAC configuration, without which it cannot be decoded" : "";
}

void WarnOfUnplayed(const Input& input, uint32_t streams)
{
    TagReader reader(input);
    for (const flvdmx::Stream stream : {flvdmx::Stream::video, flvdmx::Stream::audio})
        if (const std::string& why = reader.WhyNoStream(stream);
            !why.empty() && (streams & static_cast<uint32_t>(stream)) != 0)
            Complain(input.name, fmt::format("warning: the {} is not played: {}", StreamName(stream), why));
}

std::string UndefinedCodec(const Input& input)
{
    std::string codec;
    if (input.info.video && flvdmx::name(input.info.video->codec) == std::string("unknown"))
        codec = "video's codec, " + CodecName(input.info.video->codec);
    else if (input.info.audio && flvdmx::name(input.info.audio->codec) == std::string("unknown"))
        codec = "audio's codec, " + CodecName(input.info.audio->codec);
    return codec.empty()
               ? codec
               : fmt::format("the {}, is not defined by FLV: its frames contain everything after the codec byte",
                             codec);
}

Losses::Losses(const Input& input, std::function<void(const Tag&)> script)
    : m_input(input), m_script(std::move(script)), m_reader(input),
      m_end(int64_t{input.Instance().data_offset} + BACK_POINTER_SIZE)
{
}

bool Losses::Take(const flvdmx::Frame& frame)
{
    if (frame.position < 0)
        return false;
    const int64_t before = m_bytes;
    Inspect(m_end, frame.position);
    m_end = EndOf(frame);
    return m_bytes > before;
}

int64_t Losses::EndOf(const flvdmx::Frame& frame)
{
    if (!m_input.Has(frame.stream)) { // the stream was found after the open
        const std::optional<Tag> tag = m_reader.At(frame.position);
        return tag ? tag->End() : frame.position;
    }
    Tag tag{}; // with the codec byte of its stream
    tag.position = frame.position;
    tag.type = frame.stream == flvdmx::Stream::video ? FLVD_TAG_TYPE_VIDEO : FLVD_TAG_TYPE_AUDIO;
    tag.codec = static_cast<uint8_t>(tag.IsVideo() ? m_input.Instance().video_codec_filter
                                                   : m_input.Instance().audio_format_filter);
    tag.size = static_cast<uint32_t>(frame.data.size()) + tag.CodecHeaderSize();
    return tag.End();
}

// Usually there is nothing between two frames; otherwise there are configurations, script data, tags that are not
// played, or damage.
void Losses::Inspect(int64_t from, int64_t to)
{
    while (from < to) {
        const std::optional<Tag> tag = m_reader.Find(from, to);
        Lose(from, tag ? tag->position : to);
        if (!tag)
            return;
        if (tag->IsFrame() || (!tag->IsScript() && !m_input.Has(tag->Stream())))
            Lose(tag->position, tag->End());
        else if (m_script && tag->IsScript())
            m_script(*tag);
        from = tag->End();
    }
}

void Losses::Lose(int64_t from, int64_t to)
{
    m_bytes += std::max<int64_t>(to - from, 0);
    while (from < to) {
        const std::optional<Tag> tag = m_reader.At(from);
        const bool whole = tag && tag->streamId == 0 && tag->End() <= to;
        const std::string why = whole ? m_reader.WhyNotPlayed(*tag) : "";
        const int64_t end = why.empty() ? to : tag->End();
        Loss& loss = why.empty() ? m_damage : m_unplayed;
        if (loss.bytes == 0)
            loss = {0, from, why};
        loss.bytes += end - from;
        from = end;
    }
}

void Losses::Warn() const
{
    if (m_damage.bytes > 0)
        Complain(m_input.name, fmt::format("warning: skipped {} without a valid tag, the first at byte {}",
                                           Plural(static_cast<uint64_t>(m_damage.bytes), "byte"), m_damage.first));
    if (m_unplayed.bytes > 0)
        Complain(m_input.name, fmt::format("warning: skipped {} of tags, the first at byte {}: {}",
                                           Plural(static_cast<uint64_t>(m_unplayed.bytes), "byte"), m_unplayed.first,
                                           m_unplayed.why));
}

} // namespace tool
