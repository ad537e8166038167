#include "flv_writer.h"

#include <algorithm>
#include <cstring>
#include <ostream>

namespace flvd_test {

Bytes BigEndian(uint64_t value, int bytes)
{
    Bytes out;
    while (bytes-- > 0)
        out.push_back(static_cast<uint8_t>(value >> (8 * bytes)));
    return out;
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
        if (m_free == 0)
            m_bytes.push_back(0);
        m_free = (m_free + 7) % 8;
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

Bytes Text(uint8_t marker, int length_bytes, const std::string& text)
{
    return Concat({{marker}, BigEndian(text.size(), length_bytes), Bytes(text.begin(), text.end())});
}

Bytes Number(double value)
{
    uint64_t bits = 0;
    std::memcpy(&bits, &value, sizeof(bits));
    return Concat({{0}, BigEndian(bits, 8)});
}

Bytes Properties(const std::vector<Property>& properties)
{
    Bytes out;
    for (const auto& [name, value] : properties)
        Append(out, Concat({BigEndian(name.size(), 2), Bytes(name.begin(), name.end()), value}));
    return Concat({out, {0, 0, 9}});
}

Bytes EcmaArray(const std::vector<Property>& properties, std::optional<uint32_t> count)
{
    return Concat({{8}, BigEndian(count.value_or(properties.size()), 4), Properties(properties)});
}

Bytes StrictArray(const std::vector<Bytes>& elements, std::optional<uint32_t> count)
{
    Bytes out = Concat({{10}, BigEndian(count.value_or(elements.size()), 4)});
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
    const auto first = static_cast<uint8_t>(key ? 0x17 : 0x27);
    return Concat({{first, packet_type}, BigEndian(static_cast<uint32_t>(composition_ms), 3), payload});
}

Bytes AvcRecord(const std::vector<Bytes>& sps, const std::vector<Bytes>& pps)
{
    Bytes out{1, 0x42, 0xC0, 0x28, 0xFF, static_cast<uint8_t>(0xE0 | sps.size())};
    for (const Bytes& set : sps)
        Append(out, Concat({BigEndian(set.size(), 2), set}));
    out.push_back(static_cast<uint8_t>(pps.size()));
    for (const Bytes& set : pps)
        Append(out, Concat({BigEndian(set.size(), 2), set}));
    return out;
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

FlvBuilder& FlvBuilder::indexed_metadata(std::vector<amf::Property> properties, IndexHook hook)
{
    m_index = {m_tags.size(), std::move(properties), std::move(hook)};
    return script({});
}

Bytes FlvBuilder::index_data(const std::vector<Tag>& tags) const
{
    std::vector<double> times, positions;
    for (const Tag& tag : tags)
        if (tag.is_keyframe()) {
            times.push_back(tag.timestamp / 1000.0);
            positions.push_back(static_cast<double>(tag.offset));
        }
    if (m_index.hook)
        m_index.hook(times, positions);
    std::vector<amf::Property> properties = m_index.properties;
    properties.emplace_back(
        "keyframes", amf::Object({{"times", amf::NumberArray(times)}, {"filepositions", amf::NumberArray(positions)}}));
    return amf::OnMetaData(properties);
}

Flv FlvBuilder::lay_out(std::vector<Tag> tags) const
{
    Flv flv{Concat({m_prefix, {'F', 'L', 'V', 1, m_flags}, BigEndian(m_data_offset, 4)}), std::move(tags)};
    if (flv.bytes.size() < m_data_offset && m_data_offset < 0x10000)
        flv.bytes.resize(m_data_offset);
    Put(flv.bytes, 0, 4);
    for (Tag& tag : flv.tags) {
        const size_t size = tag.data.size();
        tag.offset = static_cast<int64_t>(flv.bytes.size());
        Append(flv.bytes, Concat({{tag.type},
                                  BigEndian(tag.data_size.value_or(size), 3),
                                  BigEndian(tag.timestamp, 3),
                                  BigEndian(tag.timestamp >> 24, 1),
                                  BigEndian(tag.stream_id, 3)}));
        Append(flv.bytes, tag.data);
        Put(flv.bytes, tag.back_pointer.value_or(size + 11), 4);
    }
    return flv;
}

// Numbers of AMF0 have a fixed size, so the index does not change the layout once it has its entries.
Flv FlvBuilder::build() const
{
    std::vector<Tag> tags = m_tags;
    for (int pass = 0; pass < 2 && m_index.tag < tags.size(); ++pass) {
        tags[m_index.tag].data = index_data(tags);
        tags = lay_out(std::move(tags)).tags;
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

Flv MakeChain(const ChainOptions& options)
{
    FlvBuilder builder(static_cast<uint8_t>((options.video ? 1 : 0) | (options.audio ? 4 : 0)));
    const std::vector<amf::Property> size = {{"width", amf::Number(320)}, {"height", amf::Number(240)}};
    if (options.index)
        builder.indexed_metadata(size);
    else if (options.metadata)
        builder.metadata({size[0], size[1], {"framerate", amf::Number(25)}});
    if (options.video)
        builder.video(options.first_ts, AvcConfig(SmallAvcRecord()));
    if (options.audio)
        builder.audio(options.first_ts, AacConfig({0x12, 0x10}));
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
