// The tags of a file as they lie there.
#include "tools/tags.h"

#include <algorithm>
#include <string_view>

#include <fmt/core.h>

#include "tools/report.h"
#include "tools/text.h"

namespace tool {

namespace {

constexpr uint32_t READER_CACHE = 65536;
constexpr uint32_t BYTES_WITH_CODEC = TAG_HEADER_SIZE + 2;

bool IsTagType(uint32_t type)
{
    return type == FLVD_TAG_TYPE_AUDIO || type == FLVD_TAG_TYPE_VIDEO || type == FLVD_TAG_TYPE_SCRIPT;
}

Tag Parse(int64_t position, const uint8_t* bytes, uint32_t available)
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

// Video with the extended header has a FourCC after its first byte.
std::string ExtendedCodec(const Tag& tag, TagReader& reader)
{
    const uint8_t* const bytes = reader.Bytes(tag.position + TAG_HEADER_SIZE + 1, 4);
    const std::string_view fourcc(reinterpret_cast<const char*>(bytes), bytes != nullptr ? 4 : 0);
    const char* const name = fourcc == "hvc1"   ? "HEVC, "
                             : fourcc == "av01" ? "AV1, "
                             : fourcc == "vp09" ? "VP9, "
                             : fourcc == "avc1" ? "AVC, "
                                                : "";
    return fmt::format("enhanced FLV ({}FourCC '{}')", name, Printable(fourcc));
}

// CodecID 12 and 13 belong to no standard, but encoders have written them for years.
std::string VideoName(const Tag& tag, TagReader& reader)
{
    constexpr uint8_t EXTENDED_HEADER = 0x80;
    if ((tag.codec & EXTENDED_HEADER) != 0)
        return ExtendedCodec(tag, reader);
    const uint32_t id = tag.codec & CODEC_ID_MASK;
    const std::string_view name = id == 12 ? "HEVC" : id == 13 ? "AV1" : flvdmx::name(tag.VideoCodec());
    return fmt::format("{} (CodecID {})", name, id);
}

std::string AudioName(const Tag& tag)
{
    return fmt::format("{} (SoundFormat {})", flvdmx::name(tag.AudioCodec()), tag.codec >> 4);
}

// An AVC configuration that the library does not take.
std::string ConfigFault(const Tag& tag, TagReader& reader)
{
    constexpr uint32_t MOST_SET_BYTES = 128;
    constexpr uint32_t SETS_OFFSET = 6; // of the first set's length in the record
    const uint8_t* const record = reader.Bytes(tag.position + TAG_HEADER_SIZE + tag.CodecHeaderSize(), SETS_OFFSET + 2);
    if (record == nullptr || tag.size < tag.CodecHeaderSize() + SETS_OFFSET + 2)
        return "its AVC configuration is cut short";
    const uint32_t size = BigEndian(record + SETS_OFFSET, 2);
    if (size > MOST_SET_BYTES || tag.size > MOST_SET_BYTES + tag.CodecHeaderSize())
        return fmt::format("its AVC parameter sets are larger than the {} bytes that are supported", MOST_SET_BYTES);
    return "its AVC configuration is damaged";
}

} // namespace

uint32_t BigEndian(const uint8_t* bytes, uint32_t size)
{
    uint32_t value = 0;
    for (uint32_t i = 0; i < size; ++i)
        value = value << 8 | bytes[i];
    return value;
}

// AVC configuration and end of sequence and AAC configuration hold nothing to play.
bool Tag::IsFrame() const
{
    if ((!IsVideo() && !IsAudio()) || size < CodecHeaderSize())
        return false;
    return !IsConfig() && !(IsAvc() && packetType == 2);
}

TagReader::TagReader(const Input& input)
    : m_instance(input.file.instance()),
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
    return Parse(position, bytes, available);
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

std::string WhyNotPlayed(const Input& input, const Tag& tag, TagReader& reader)
{
    const flvd_ctx_t& instance = input.Instance();
    const char* const stream = StreamName(tag.Stream());
    const auto name = [&] { return tag.IsVideo() ? VideoName(tag, reader) : AudioName(tag); };
    if (tag.IsScript())
        return "";
    if (!input.Has(tag.Stream()))
        return fmt::format("are {} that is not played: {}", stream, name());
    const bool sameCodec = tag.IsVideo()
                               ? tag.VideoCodec() == input.info.video->codec && tag.codec >> 4 <= MOST_FRAME_TYPE
                               : tag.AudioCodec() == input.info.audio->codec;
    if (!sameCodec)
        return fmt::format("are of another codec than the {} stream: {}", stream, name());
    if (tag.IsAudio() && tag.codec != instance.audio_format_filter)
        return fmt::format("have another header byte than the audio stream: 0x{:02x} instead of 0x{:02x}", tag.codec,
                           instance.audio_format_filter & 0xFF);
    if (instance.last_ts != 0 && tag.timestamp > instance.last_ts)
        return "are later than the last ones of the file";
    return tag.size < tag.CodecHeaderSize() ? "are too short for a frame" : "";
}

std::string WhyNoStream(const Input& input, flvdmx::Stream stream)
{
    constexpr int TAGS = 1000; // at the beginning of the file
    TagReader reader(input);
    int64_t position = int64_t{input.Instance().data_offset} + BACK_POINTER_SIZE;
    for (int i = 0; i < TAGS; ++i) {
        const std::optional<Tag> tag = reader.At(position);
        if (!tag)
            return "";
        if (!tag->IsScript() && tag->Stream() == stream) {
            const bool known = tag->IsAvc() && tag->codec >> 4 <= MOST_FRAME_TYPE;
            if (known && tag->IsConfig())
                return ConfigFault(*tag, reader);
            return known ? "its AVC stream begins without a configuration"
                         : fmt::format("it is {}", tag->IsVideo() ? VideoName(*tag, reader) : AudioName(*tag));
        }
        position = tag->End();
    }
    return "";
}

Losses::Losses(const Input& input)
    : m_input(input), m_reader(input), m_end(int64_t{input.Instance().data_offset} + BACK_POINTER_SIZE)
{
}

bool Losses::Take(const flvdmx::Frame& frame)
{
    if (frame.position < 0)
        return false;
    Tag tag{}; // as its stream's are
    tag.position = frame.position;
    tag.type = frame.stream == flvdmx::Stream::video ? FLVD_TAG_TYPE_VIDEO : FLVD_TAG_TYPE_AUDIO;
    tag.codec = static_cast<uint8_t>(tag.IsVideo() ? m_input.Instance().video_codec_filter
                                                   : m_input.Instance().audio_format_filter);
    tag.size = static_cast<uint32_t>(frame.data.size()) + tag.CodecHeaderSize();
    const int64_t before = m_bytes;
    Inspect(m_end, tag.position);
    m_end = tag.End();
    return m_bytes > before;
}

// What lies between two frames: mostly nothing, else configurations, script data, tags that are not played, or damage.
void Losses::Inspect(int64_t from, int64_t to)
{
    while (from < to) {
        const std::optional<Tag> tag = m_reader.Find(from, to);
        Lose(from, tag ? tag->position : to);
        if (!tag)
            return;
        if (tag->IsFrame())
            Lose(tag->position, tag->End());
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
            m_why = WhyNotPlayed(m_input, *tag, m_reader);
}

void Losses::Warn() const
{
    if (m_bytes == 0)
        return;
    const std::string why = m_why.empty() ? "" : fmt::format("; tags from there on {}", m_why);
    Complain(m_input.name, fmt::format("warning: {} bytes, the first at byte {}, hold no valid tag of the streams and "
                                       "are left out{}",
                                       m_bytes, m_first, why));
}

flvdmx::Milliseconds Takes::Continue(const flvdmx::Frame& frame)
{
    constexpr flvdmx::Milliseconds JITTER{1000};
    Lane& lane = frame.stream == flvdmx::Stream::video ? m_video : m_audio;
    if (frame.time + JITTER < lane.last) {
        if (++lane.take == m_offsets.size())
            m_offsets.push_back(m_latest - frame.time);
    }
    lane.last = frame.time;
    const flvdmx::Milliseconds time = frame.time + m_offsets[lane.take];
    m_latest = std::max(m_latest, time);
    return time;
}

} // namespace tool
