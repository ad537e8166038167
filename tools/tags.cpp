// The tags of a file as they are there.
#include "tools/tags.h"

#include <algorithm>
#include <string_view>

#include <fmt/core.h>

#include "tools/report.h"
#include "tools/text.h"

namespace tool {

namespace {

constexpr uint32_t READER_CACHE = 4096; // more would bypass the window that the host reads ahead
constexpr int TAGS_PROBED = 102;        // in which an open finds the streams
constexpr uint32_t BYTES_WITH_CODEC = TAG_HEADER_SIZE + 2;

bool IsTagType(uint32_t type)
{
    return type == FLVD_TAG_TYPE_AUDIO || type == FLVD_TAG_TYPE_VIDEO || type == FLVD_TAG_TYPE_SCRIPT;
}

} // namespace

uint32_t BigEndian(const uint8_t* bytes, uint32_t size)
{
    uint32_t value = 0;
    for (uint32_t i = 0; i < size; ++i)
        value = value << 8 | bytes[i];
    return value;
}

Tag ParseTag(int64_t position, const uint8_t* bytes, uint32_t available)
{
    constexpr uint32_t STREAM_ID_OFFSET = 8;
    Tag tag{};
    tag.position = position;
    tag.type = bytes[0];
    tag.size = BigEndian(bytes + 1, 3);
    tag.timestamp = BigEndian(bytes + 4, 3) | static_cast<uint32_t>(bytes[7]) << 24;
    tag.streamId = BigEndian(bytes + STREAM_ID_OFFSET, 3);
    if (tag.size > 0 && available > TAG_HEADER_SIZE)
        tag.codec = bytes[TAG_HEADER_SIZE];
    if (tag.size > 1 && available > TAG_HEADER_SIZE + 1)
        tag.packetType = bytes[TAG_HEADER_SIZE + 1];
    return tag;
}

// AVC configuration and end of sequence and AAC configuration hold nothing to play.
bool Tag::IsFrame() const
{
    if ((!IsVideo() && !IsAudio()) || size < CodecHeaderSize())
        return false;
    return !IsConfig() && !(IsAvc() && packetType == 2);
}

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
    if (bytes == nullptr || !IsTagType(bytes[0]))
        return std::nullopt;
    return ParseTag(position, bytes, available);
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

// CodecID 12 and 13 belong to no standard, but encoders have written them for years.
std::string VideoCodecName(flvdmx::VideoCodec codec)
{
    const auto id = static_cast<uint32_t>(codec);
    return fmt::format("{} (CodecID {})", id == 12 ? "HEVC" : id == 13 ? "AV1" : flvdmx::name(codec), id);
}

std::string TagReader::ExtendedCodec(const Tag& tag)
{
    const uint8_t* const bytes = Bytes(tag.position + TAG_HEADER_SIZE + 1, 4);
    const std::string_view fourcc(reinterpret_cast<const char*>(bytes), bytes != nullptr ? 4 : 0);
    const char* const name = fourcc == "hvc1"   ? "HEVC, "
                             : fourcc == "av01" ? "AV1, "
                             : fourcc == "vp09" ? "VP9, "
                             : fourcc == "avc1" ? "AVC, "
                                                : "";
    return fmt::format("enhanced FLV ({}FourCC '{}')", name, Printable(fourcc));
}

std::string TagReader::NameCodec(const Tag& tag)
{
    if (tag.IsExtended())
        return ExtendedCodec(tag);
    return tag.IsVideo() ? VideoCodecName(tag.VideoCodec())
                         : fmt::format("{} (SoundFormat {})", flvdmx::name(tag.AudioCodec()), tag.codec >> 4);
}

std::string TagReader::WhyNotPlayed(const Tag& tag)
{
    if (tag.IsScript())
        return "";
    const char* const stream = StreamName(tag.Stream());
    const std::string& none = WhyNoStream(tag.Stream());
    if (!none.empty() || !m_input.Has(tag.Stream()))
        return fmt::format("are {} that is not played{}{}", stream, none.empty() ? "" : ": ", none);
    const bool sameCodec = tag.IsVideo()
                               ? tag.VideoCodec() == m_input.info.video->codec && tag.codec >> 4 <= MOST_FRAME_TYPE
                               : tag.AudioCodec() == m_input.info.audio->codec;
    if (!sameCodec)
        return fmt::format("are of another codec than the {} stream: {}", stream, NameCodec(tag));
    if (tag.IsAudio() && tag.codec != m_instance->audio_format_filter)
        return fmt::format("have another header byte than the audio stream: 0x{:02x} instead of 0x{:02x}", tag.codec,
                           m_instance->audio_format_filter & 0xFF);
    if (m_instance->last_ts != 0 && tag.timestamp > m_instance->last_ts)
        return "are later than the last ones of the file";
    return tag.size < tag.CodecHeaderSize() ? "are too short for a frame" : "";
}

const std::string& TagReader::WhyNoStream(flvdmx::Stream stream)
{
    const bool video = stream == flvdmx::Stream::video;
    std::optional<std::string>& reason = video ? m_noVideo : m_noAudio;
    const bool played = m_input.Has(stream) && !(video && (m_instance->video_codec_filter & EXTENDED_HEADER) != 0);
    if (!reason)
        reason = played ? "" : FindReason(stream);
    return *reason;
}

// An AVC configuration that the library does not take.
std::string TagReader::ConfigFault(const Tag& tag)
{
    constexpr uint32_t MOST_SET_BYTES = 128;
    constexpr uint32_t SETS_OFFSET = 6; // of the first set's length in the record
    const uint8_t* const record = Bytes(tag.position + TAG_HEADER_SIZE + tag.CodecHeaderSize(), SETS_OFFSET + 2);
    if (record == nullptr || tag.size < tag.CodecHeaderSize() + SETS_OFFSET + 2)
        return "its AVC configuration is cut short";
    const uint32_t size = BigEndian(record + SETS_OFFSET, 2);
    if (size > MOST_SET_BYTES || tag.size > MOST_SET_BYTES + tag.CodecHeaderSize())
        return fmt::format("its AVC parameter sets are larger than the {} bytes that are supported", MOST_SET_BYTES);
    return "its AVC configuration is damaged";
}

void WarnOfUnplayed(const Input& input, uint32_t streams)
{
    TagReader reader(input);
    for (const flvdmx::Stream stream : {flvdmx::Stream::video, flvdmx::Stream::audio})
        if (const std::string& why = reader.WhyNoStream(stream);
            !why.empty() && (streams & static_cast<uint32_t>(stream)) != 0)
            Complain(input.name, fmt::format("warning: the {} is not played: {}", StreamName(stream), why));
}

TagReader::Numbered TagReader::First(flvdmx::Stream stream)
{
    constexpr int TAGS = 5000; // at the beginning of the file
    std::optional<Tag> tag = At(int64_t{m_instance->data_offset} + BACK_POINTER_SIZE);
    for (int i = 0; i < TAGS && tag; ++i) {
        if (!tag->IsScript() && tag->Stream() == stream)
            return {tag, i};
        tag = At(tag->End());
    }
    return {};
}

std::optional<Tag> TagReader::FirstIfLate(flvdmx::Stream stream)
{
    const auto [tag, number] = First(stream);
    return number >= TAGS_PROBED ? tag : std::nullopt;
}

std::string TagReader::FindReason(flvdmx::Stream stream)
{
    const auto [tag, number] = First(stream);
    if (!tag)
        return "";
    if (number >= TAGS_PROBED)
        return fmt::format("it begins at byte {}, after the first {} tags", tag->position, TAGS_PROBED);
    if (!tag->IsAvc() || tag->IsExtended())
        return fmt::format("it is {}", NameCodec(*tag));
    return tag->IsConfig() ? ConfigFault(*tag) : "its AVC stream begins without a configuration";
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
    if (!m_input.Has(frame.stream)) { // it was found after the open
        const std::optional<Tag> tag = m_reader.At(frame.position);
        return tag ? tag->End() : frame.position;
    }
    Tag tag{}; // as its stream's are
    tag.position = frame.position;
    tag.type = frame.stream == flvdmx::Stream::video ? FLVD_TAG_TYPE_VIDEO : FLVD_TAG_TYPE_AUDIO;
    tag.codec = static_cast<uint8_t>(tag.IsVideo() ? m_input.Instance().video_codec_filter
                                                   : m_input.Instance().audio_format_filter);
    tag.size = static_cast<uint32_t>(frame.data.size()) + tag.CodecHeaderSize();
    return tag.End();
}

// What is between two frames: mostly nothing, else configurations, script data, tags that are not played, or damage.
void Losses::Inspect(int64_t from, int64_t to)
{
    while (from < to) {
        const std::optional<Tag> tag = m_reader.Find(from, to);
        Lose(from, tag ? tag->position : to);
        if (!tag)
            return;
        if (tag->IsFrame())
            Lose(tag->position, tag->End());
        else if (m_script && tag->IsScript())
            m_script(*tag);
        from = tag->End();
    }
}

void Losses::Lose(int64_t from, int64_t to)
{
    if (from >= to)
        return;
    if (m_bytes == 0)
        m_first = from;
    m_bytes += to - from;
    if (m_why.empty())
        if (const std::optional<Tag> tag = m_reader.At(from); tag && tag->streamId == 0 && tag->End() <= to)
            m_why = m_reader.WhyNotPlayed(*tag);
}

void Losses::Warn() const
{
    if (m_bytes == 0)
        return;
    const std::string why = m_why.empty() ? "hold no valid tag of the streams and are left out"
                                          : fmt::format("are left out: tags from there on {}", m_why);
    Complain(m_input.name, fmt::format("warning: {} bytes, the first at byte {}, {}", m_bytes, m_first, why));
}

} // namespace tool
