// Tags as they are played.
#include "tools/tags.h"

namespace tool {

uint32_t BigEndian(const uint8_t* bytes, uint32_t size)
{
    uint32_t value = 0;
    for (uint32_t i = 0; i < size; ++i)
        value = value << 8 | bytes[i];
    return value;
}

Tag Tag::Parse(int64_t position, const uint8_t* bytes, uint32_t available)
{
    Tag tag{};
    tag.position = position;
    tag.type = bytes[0];
    tag.size = BigEndian(bytes + 1, 3);
    tag.timestamp = BigEndian(bytes + 4, 3) | static_cast<uint32_t>(bytes[7]) << 24;
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

std::optional<int64_t> FindTag(flvd_ctx_t* instance, fio_file_t* reader, int64_t from, int64_t end,
                               const std::function<void(int64_t)>& progress)
{
    constexpr uint32_t ALL_KINDS = FLVD_TAG_VIDEO | FLVD_TAG_AUDIO | FLVD_TAG_SCRIPT;
    int64_t reached = from - 1;
    if (__FLV_DMX__fioSeek64(reader, from, FIO_SEEK_SET) != 0)
        return std::nullopt;
    for (;;) {
        flvd_tag_info_t info{};
        const int32_t result = FLVD_GetCurrTagInfo(instance, reader, &info, ALL_KINDS, 1 /* verify */);
        const int64_t position = __FLV_DMX__fioTell64(reader);
        if (result == 0)
            return position;
        if (position <= reached || position >= end)
            return std::nullopt;
        progress(reached = position);
    }
}

TagReader::TagReader(const Demuxer& demuxer)
    : m_instance(demuxer.Instance()), m_reader(demuxer.Reader(FLVD_STREAM_VIDEO)), m_streams(demuxer.Streams()),
      m_next(m_instance->data_offset), m_end(m_next + BACK_POINTER_SIZE)
{
}

std::optional<Tag> TagReader::Find()
{
    const auto position = FindTag(m_instance, m_reader, m_next, m_instance->data_end, [](int64_t) {});
    const uint8_t* bytes = nullptr;
    const uint32_t available = position ? __FLV_DMX__fioShowBytesByPtr(&bytes, TAG_HEADER_SIZE + 2, m_reader) : 0;
    if (available < TAG_HEADER_SIZE)
        return std::nullopt;
    return Tag::Parse(*position, bytes, available);
}

void TagReader::Skip(int64_t from, int64_t to)
{
    if (from >= to)
        return;
    if (m_skipped == 0)
        m_firstSkipped = from;
    m_skipped += to - from;
}

std::optional<Tag> TagReader::Next()
{
    while (const std::optional<Tag> tag = Find()) {
        Skip(m_end, tag->position);
        m_next = m_end = tag->End();
        if (tag->type == FLVD_TAG_TYPE_SCRIPT)
            continue;
        if ((tag->Stream() & m_streams) != 0)
            return tag;
        Skip(tag->position, m_end);
    }
    Skip(m_end, m_instance->data_end);
    m_next = m_end = m_instance->data_end;
    return std::nullopt;
}

std::vector<uint8_t> TagReader::Data(const Tag& tag)
{
    const uint32_t header = tag.CodecHeaderSize();
    if (tag.size <= header ||
        __FLV_DMX__fioSeek64(m_reader, tag.position + TAG_HEADER_SIZE + header, FIO_SEEK_SET) != 0)
        return {};
    std::vector<uint8_t> data(tag.size - header);
    data.resize(__FLV_DMX__fioRead(data.data(), 1, static_cast<uint32_t>(data.size()), m_reader));
    return data;
}

} // namespace tool
