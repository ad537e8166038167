// The tags of a file.
#include "tools/tags.h"

#include <algorithm>
#include <utility>

#include "tools/input.h"
#include "tools/report.h"

namespace tool {

namespace {

constexpr uint32_t READER_CACHE = 4096; // a larger one would bypass the host's read-ahead window

} // namespace

uint32_t BigEndian(const uint8_t* bytes, uint32_t size)
{
    uint32_t value = 0;
    for (uint32_t i = 0; i < size; ++i)
        value = value << 8 | bytes[i];
    return value;
}

TagReader::TagReader(const std::string& name, flvd_ctx_t* instance, Progress progress)
    : m_name(name), m_instance(instance), m_progress(std::move(progress)),
      m_reader(__FLV_DMX__fioOpen(PathOf(name).c_str(), FIO_MODE_READ | FIO_MODE_BINARY, READER_CACHE, 0, 0))
{
    if (m_reader == nullptr)
        throw FileError(name, "cannot be opened a second time");
    if (__FLV_DMX__fioSeek64(m_reader.get(), 0, FIO_SEEK_END) == 0)
        m_size = __FLV_DMX__fioTell64(m_reader.get());
}

int64_t TagReader::FirstTag()
{
    constexpr int64_t DATA_OFFSET = 5; // in the file header
    if (m_instance != nullptr)
        return int64_t{m_instance->data_offset} + Tag::back_pointer_size;
    const uint8_t* const bytes = Bytes(DATA_OFFSET, sizeof(uint32_t));
    return bytes != nullptr ? int64_t{BigEndian(bytes, sizeof(uint32_t))} + Tag::back_pointer_size : m_size;
}

const uint8_t* TagReader::Bytes(int64_t position, uint32_t size)
{
    const uint8_t* bytes = nullptr;
    if (position < 0 || position > m_size || size > m_size - position ||
        __FLV_DMX__fioSeek64(m_reader.get(), position, FIO_SEEK_SET) != 0)
        return nullptr;
    return __FLV_DMX__fioShowBytesByPtr(&bytes, size, m_reader.get()) == size ? bytes : nullptr;
}

std::vector<uint8_t> TagReader::Payload(const Tag& tag)
{
    std::vector<uint8_t> payload(tag.data_size());
    const auto size = static_cast<uint32_t>(payload.size());
    if (__FLV_DMX__fioSeek64(m_reader.get(), tag.data_position(), FIO_SEEK_SET) != 0 ||
        __FLV_DMX__fioRead(payload.data(), 1, size, m_reader.get()) != size)
        throw FileError(m_name, "cannot be read");
    return payload;
}

std::vector<uint8_t> TagReader::Config(const Tag& tag)
{
    const std::vector<uint8_t> payload = Payload(tag);
    const size_t header = std::min<size_t>(tag.codec_header_size(), payload.size());
    return {payload.begin() + static_cast<ptrdiff_t>(header), payload.end()};
}

std::optional<Tag> TagReader::At(int64_t position)
{
    const auto size = static_cast<uint32_t>(std::clamp<int64_t>(m_size - position, 0, Tag::bytes_used));
    const uint8_t* const bytes = size < Tag::header_size ? nullptr : Bytes(position, size);
    if (bytes == nullptr)
        return std::nullopt;
    const Tag tag(position, {bytes, size});
    return tag.stream() != flvdmx::Stream::any || tag.is_script() ? std::optional(tag) : std::nullopt;
}

// Most tags need a single read: the back-pointer and the next header are adjacent.
bool TagReader::IsLinked(const Tag& tag)
{
    const uint8_t* const bytes = Bytes(tag.data_end(), Tag::back_pointer_size);
    return bytes != nullptr && BigEndian(bytes, Tag::back_pointer_size) == Tag::header_size + tag.data_size();
}

// Without a back-pointer that confirms it, the next header must have a known type and StreamID 0, and its tag must be
// complete.
bool TagReader::CouldFollow(int64_t position)
{
    const std::optional<Tag> next = At(position);
    return next && next->data_end() <= m_size && next->stream_id() == 0;
}

Part TagReader::PartAt(int64_t position, int64_t to)
{
    const std::optional<Tag> tag = At(position);
    if (tag && tag->end() <= to && IsLinked(*tag))
        return {Part::Kind::tag, position, tag->end(), *tag};
    if (tag && tag->is_script() && tag->end() <= to && position == FirstTag())
        return {Part::Kind::unlinked, position, tag->end(), *tag};
    const std::optional<Tag> found = Find(position + 1, to);
    if (tag)
        for (const int64_t next : {tag->end(), tag->data_end()})
            if (next <= to && (!found || found->position >= next) &&
                (CouldFollow(next) || (next == tag->end() && next == m_size)))
                return {Part::Kind::unlinked, position, next, *tag};
    return {Part::Kind::damage, position, found ? found->position : to, tag.value_or(Tag())};
}

void TagReader::Walk(int64_t from, int64_t to, const std::function<bool(const Part&)>& see)
{
    while (from < to) {
        if (m_progress)
            m_progress(from);
        const Part part = PartAt(from, to);
        if (!see(part))
            return;
        from = part.end;
    }
}

// Many tags without a valid back-pointer may come before the same valid tag: it is searched once.
std::optional<Tag> TagReader::Find(int64_t from, int64_t to)
{
    const bool known = m_found.from >= 0 && from >= m_found.from && from <= m_found.end;
    if (!known || (!m_found.tag && to > m_found.end)) {
        const std::optional<Tag> tag = Search(from, to);
        m_found = {from, tag ? tag->position : to, tag};
    }
    return m_found.tag && m_found.tag->position < to ? m_found.tag : std::nullopt;
}

// One search of the library covers a limited range, so it is repeated while the reader advances.
std::optional<Tag> TagReader::Search(int64_t from, int64_t to)
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
            return position < to ? At(position) : std::nullopt;
        if (position <= reached || position >= to)
            return std::nullopt;
        reached = position;
        if (m_progress)
            m_progress(reached);
    }
}

} // namespace tool
