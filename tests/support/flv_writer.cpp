#include "flv_writer.h"

#include <algorithm>
#include <cstring>
#include <ostream>

namespace flvd_test {

void Put(Bytes& out, uint64_t value, int bytes)
{
    while (bytes-- > 0)
        out.push_back(static_cast<uint8_t>(value >> (8 * bytes)));
}

void Append(Bytes& out, const Bytes& more)
{
    out.insert(out.end(), more.begin(), more.end());
}

Bytes Concat(std::initializer_list<Bytes> parts)
{
    Bytes out;
    for (const Bytes& part : parts)
        Append(out, part);
    return out;
}

Bytes Noise(size_t size, uint32_t seed)
{
    Bytes out(size);
    uint32_t state = seed * 2654435761u + 1;
    for (uint8_t& byte : out) {
        state = state * 1664525u + 1013904223u;
        byte = static_cast<uint8_t>(state >> 24);
        if (byte == 8 || byte == 9 || byte == 18)
            byte = static_cast<uint8_t>(byte | 0x80);
    }
    return out;
}

BitWriter& BitWriter::u(int bits, uint32_t value)
{
    while (bits-- > 0) {
        if (m_free == 0) {
            m_bytes.push_back(0);
            m_free = 8;
        }
        --m_free;
        m_bytes.back() = static_cast<uint8_t>(m_bytes.back() | ((value >> bits & 1u) << m_free));
    }
    return *this;
}

BitWriter& BitWriter::ue(uint32_t value)
{
    int length = 0;
    while ((uint64_t{value} + 1) >> (length + 1) != 0)
        ++length;
    u(length, 0);
    return u(1, 1).u(length, static_cast<uint32_t>(uint64_t{value} + 1));
}

BitWriter& BitWriter::se(int32_t value)
{
    return ue(value > 0 ? static_cast<uint32_t>(value) * 2 - 1 : static_cast<uint32_t>(-int64_t{value}) * 2);
}

namespace amf {

static Bytes Marked(uint8_t marker, uint64_t number, int bytes)
{
    Bytes out{marker};
    Put(out, number, bytes);
    return out;
}

Bytes Text(uint8_t marker, int length_bytes, const std::string& text)
{
    Bytes out = Marked(marker, text.size(), length_bytes);
    out.insert(out.end(), text.begin(), text.end());
    return out;
}

Bytes Number(double value)
{
    uint64_t bits = 0;
    std::memcpy(&bits, &value, sizeof(bits));
    return Marked(0, bits, 8);
}

Bytes Properties(const std::vector<Property>& properties)
{
    Bytes out;
    for (const auto& [name, value] : properties) {
        Put(out, name.size(), 2);
        out.insert(out.end(), name.begin(), name.end());
        Append(out, value);
    }
    Put(out, 9, 3);
    return out;
}

Bytes EcmaArray(const std::vector<Property>& properties, std::optional<uint32_t> count)
{
    return Concat({Marked(8, count.value_or(static_cast<uint32_t>(properties.size())), 4), Properties(properties)});
}

Bytes StrictArray(const std::vector<Bytes>& elements, std::optional<uint32_t> count)
{
    Bytes out = Marked(10, count.value_or(static_cast<uint32_t>(elements.size())), 4);
    for (const Bytes& element : elements)
        Append(out, element);
    return out;
}

Bytes NumberArray(const std::vector<double>& numbers)
{
    std::vector<Bytes> elements(numbers.size());
    std::transform(numbers.begin(), numbers.end(), elements.begin(), Number);
    return StrictArray(elements);
}

} // namespace amf

Bytes AvcNalu(bool key, const Bytes& payload, int32_t composition_ms, uint8_t packet_type)
{
    Bytes out{static_cast<uint8_t>(key ? 0x17 : 0x27), packet_type};
    Put(out, static_cast<uint32_t>(composition_ms), 3);
    Append(out, payload);
    return out;
}

static void PutParameterSets(Bytes& out, const std::vector<Bytes>& sets)
{
    for (const Bytes& set : sets) {
        Put(out, set.size(), 2);
        Append(out, set);
    }
}

Bytes AvcRecord(const std::vector<Bytes>& sps, const std::vector<Bytes>& pps)
{
    Bytes out{1, 0x42, 0xC0, 0x28, 0xFF, static_cast<uint8_t>(0xE0 | sps.size())};
    PutParameterSets(out, sps);
    out.push_back(static_cast<uint8_t>(pps.size()));
    PutParameterSets(out, pps);
    return out;
}

Bytes Filled(Bytes head, size_t size)
{
    if (size > head.size())
        Append(head, Noise(size - head.size()));
    return head;
}

Bytes H263Picture(uint32_t size_code, uint32_t width, uint32_t height, size_t size)
{
    BitWriter head;
    head.u(17, 1).u(5, 0).u(8, 1).u(3, size_code);
    if (size_code < 2) {
        const int bits = size_code == 0 ? 8 : 16;
        head.u(bits, width).u(bits, height);
    }
    return Filled(head.bytes(), size);
}

Bytes Vp6Picture(bool alpha, uint8_t columns, uint8_t rows, uint8_t adjust, size_t size)
{
    const Bytes offset_to_alpha = alpha ? Bytes{0, 0, 100} : Bytes{};
    return Filled(Concat({{adjust}, offset_to_alpha, {0x00, 0x46, rows, columns, rows, columns}}), size);
}

bool operator==(const Frame& a, const Frame& b)
{
    return a.stream == b.stream && a.timestamp == b.timestamp && a.data == b.data;
}

void PrintTo(const Frame& frame, std::ostream* out)
{
    *out << (frame.stream == 1 ? "video " : "audio ") << frame.timestamp << " ms, " << frame.data.size() << " bytes";
}

size_t Tag::codec_bytes() const
{
    if (type == 9)
        return !data.empty() && (data[0] & 15) == 7 ? 5 : 1;
    return !data.empty() && data[0] >> 4 == 10 ? 2 : 1;
}

bool Tag::is_frame() const
{
    if ((type != 8 && type != 9) || data.size() < codec_bytes())
        return false;
    if (codec_bytes() == 5)
        return (data[1] & 0xFD) != 0;
    return codec_bytes() == 1 || data[1] != 0;
}

uint32_t Flv::first_ts() const
{
    uint32_t first = UINT32_MAX;
    for (const Tag& tag : tags)
        first = tag.is_frame() ? std::min(first, tag.timestamp) : first;
    return first;
}

Frames Flv::frames(uint32_t streams, uint32_t first) const
{
    Frames out;
    for (const Tag& tag : tags) {
        if (!tag.is_frame() || (tag.stream() & streams) == 0)
            continue;
        const auto begin = tag.data.begin() + static_cast<std::ptrdiff_t>(tag.codec_bytes());
        out.push_back({tag.stream(), tag.timestamp - first, Bytes(begin, tag.data.end())});
    }
    return out;
}

FlvBuilder& FlvBuilder::add(Tag tag)
{
    m_tags.push_back(std::move(tag));
    return *this;
}

FlvBuilder& FlvBuilder::indexed_metadata(std::vector<amf::Property> properties, IndexHook hook)
{
    m_index_tag = m_tags.size();
    m_index_properties = std::move(properties);
    m_index_hook = std::move(hook);
    return script({});
}

Bytes FlvBuilder::index_data(const std::vector<Tag>& tags) const
{
    std::vector<double> times;
    std::vector<double> positions;
    for (const Tag& tag : tags) {
        if (!tag.is_keyframe())
            continue;
        times.push_back(tag.timestamp / 1000.0);
        positions.push_back(static_cast<double>(tag.offset));
    }
    if (m_index_hook)
        m_index_hook(times, positions);
    std::vector<amf::Property> properties = m_index_properties;
    properties.emplace_back(
        "keyframes", amf::Object({{"times", amf::NumberArray(times)}, {"filepositions", amf::NumberArray(positions)}}));
    return amf::OnMetaData(properties);
}

static void PutTag(Bytes& out, Tag& tag)
{
    const uint32_t size = static_cast<uint32_t>(tag.data.size());
    tag.offset = static_cast<int64_t>(out.size());
    Put(out, tag.type, 1);
    Put(out, tag.data_size.value_or(size), 3);
    Put(out, tag.timestamp, 3);
    Put(out, tag.timestamp >> 24, 1);
    Put(out, tag.stream_id, 3);
    Append(out, tag.data);
    Put(out, tag.back_pointer.value_or(size + 11), 4);
}

Flv FlvBuilder::lay_out(std::vector<Tag> tags) const
{
    Flv flv;
    flv.bytes = Concat({m_prefix, {'F', 'L', 'V', 1, m_flags}});
    Put(flv.bytes, m_data_offset, 4);
    if (flv.bytes.size() < m_data_offset && m_data_offset < 0x10000)
        flv.bytes.resize(m_data_offset);
    Put(flv.bytes, 0, 4);
    for (Tag& tag : tags)
        PutTag(flv.bytes, tag);
    flv.tags = std::move(tags);
    return flv;
}

// Numbers of AMF0 have a fixed size, so the index does not change the layout once it has its entries.
Flv FlvBuilder::build() const
{
    std::vector<Tag> tags = m_tags;
    if (m_index_tag) {
        tags[*m_index_tag].data = index_data(tags);
        tags = lay_out(std::move(tags)).tags;
        tags[*m_index_tag].data = index_data(tags);
    }
    return lay_out(std::move(tags));
}

Flv File(const std::vector<Tag>& tags, uint8_t flags, const Bytes& prefix, uint32_t header)
{
    FlvBuilder builder(flags, static_cast<uint32_t>(prefix.size()) + header, prefix);
    for (const Tag& tag : tags)
        builder.add(tag);
    return builder.build();
}

static void AddConfigurations(FlvBuilder& builder, const ChainOptions& options)
{
    if (options.index)
        builder.indexed_metadata({{"width", amf::Number(320)}, {"height", amf::Number(240)}});
    else if (options.metadata)
        builder.metadata({{"width", amf::Number(320)}, {"height", amf::Number(240)}, {"framerate", amf::Number(25)}});
    if (options.video)
        builder.video(options.first_ts, AvcConfig(SmallAvcRecord()));
    if (options.audio)
        builder.audio(options.first_ts, AacConfig({0x12, 0x10}));
}

Flv MakeChain(const ChainOptions& options)
{
    FlvBuilder builder(static_cast<uint8_t>((options.video ? 1 : 0) | (options.audio ? 4 : 0)));
    AddConfigurations(builder, options);
    uint32_t sounds = 0;
    for (uint32_t picture = 0; picture < options.pictures; ++picture) {
        const bool key = picture % options.gop == 0;
        if (options.video)
            builder.video(options.first_ts + picture * 40, AvcNalu(key, Noise(300 + picture * 37 % 101, picture)));
        for (; options.audio && sounds * 23 < (picture + 1) * 40; ++sounds)
            builder.audio(options.first_ts + sounds * 23, AacRaw(Noise(80 + sounds * 13 % 29, 1000 + sounds)));
    }
    return builder.build();
}

} // namespace flvd_test
