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

Bytes Concat(const std::vector<Bytes>& parts)
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

BitWriter& BitWriter::u(int bits, uint64_t value)
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
    int zeros = 0;
    while ((uint64_t{value} + 1) >> (zeros + 1) != 0)
        ++zeros;
    return u(zeros, 0).u(zeros + 1, uint64_t{value} + 1);
}

namespace amf {

static Bytes Text(const std::string& text, int length_bytes)
{
    return Concat({BigEndian(text.size(), length_bytes), Bytes(text.begin(), text.end())});
}

// With their end marker.
static Bytes Properties(const std::vector<Property>& properties)
{
    Bytes out;
    for (const auto& [name, value] : properties)
        Append(out, Concat({Text(name, 2), value}));
    return Concat({out, {0, 0, 9}});
}

Bytes Number(double value)
{
    uint64_t bits = 0;
    std::memcpy(&bits, &value, sizeof(bits));
    return Concat({{0}, BigEndian(bits, 8)});
}

Bytes String(const std::string& text)
{
    return Concat({{2}, Text(text, 2)});
}

Bytes LongString(const std::string& text)
{
    return Concat({{12}, Text(text, 4)});
}

Bytes Object(const std::vector<Property>& properties)
{
    return Concat({{3}, Properties(properties)});
}

Bytes OnMetaData(const std::vector<Property>& properties)
{
    return Concat({String("onMetaData"), {8}, BigEndian(properties.size(), 4), Properties(properties)});
}

Bytes StrictArray(const std::vector<Bytes>& elements, std::optional<uint32_t> count)
{
    return Concat({{10}, BigEndian(count.value_or(elements.size()), 4), Concat(elements)});
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

Bytes SmallAvcRecord()
{
    return AvcRecord({{0x67, 0x42, 0xC0, 0x28, 0xDA, 0x05, 0x07, 0xE4}}, {{0x68, 0xCE, 0x3C, 0x80}});
}

// A payload that begins so and goes on with noise.
static Bytes Filled(const Bytes& head, size_t size)
{
    return Concat({head, Noise(std::max(size, head.size()) - head.size())});
}

Bytes Mp3Frame(size_t size)
{
    return Filled({0xFF, 0xFB, 0x90, 0x64}, size);
}

Bytes H263Picture(uint32_t size_code, uint32_t width, uint32_t height, size_t size)
{
    const int bits = size_code == 0 ? 8 : size_code == 1 ? 16 : 0;
    const BitWriter head = BitWriter().u(17, 1).u(5, 0).u(8, 1).u(3, size_code).u(bits, width).u(bits, height);
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
    const uint8_t first = data.empty() ? uint8_t{0} : data[0];
    const bool packets = type == 9 ? first % 16 == 7 : first / 16 == 10;
    return !packets ? 1 : type == 9 ? 5 : 2;
}

bool Tag::is_frame() const
{
    const size_t header = codec_bytes();
    const bool media = (type == 8 || type == 9) && data.size() >= header;
    return media && (header == 1 || (data[1] != 0 && (header == 2 || data[1] != 2)));
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
                                  BigEndian(uint64_t{tag.timestamp} << 8 | tag.timestamp >> 24, 4),
                                  BigEndian(tag.stream_id, 3),
                                  tag.data,
                                  BigEndian(tag.back_pointer.value_or(size + 11), 4)}));
    }
    return flv;
}

// Numbers of AMF0 have a fixed size, so the index does not change the layout once it has its entries.
Flv FlvBuilder::build() const
{
    Flv flv = lay_out(m_tags);
    for (int pass = 0; pass < 2 && m_index.tag < m_tags.size(); ++pass) {
        flv.tags[m_index.tag].data = index_data(flv.tags);
        flv = lay_out(std::move(flv.tags));
    }
    return flv;
}

Flv File(const std::vector<Tag>& tags, uint8_t flags, const Bytes& prefix, uint32_t header)
{
    return FlvBuilder(flags, static_cast<uint32_t>(prefix.size()) + header, prefix, tags).build();
}

Flv MakeChain(const ChainOptions& options)
{
    FlvBuilder builder(static_cast<uint8_t>((options.video ? 1 : 0) | (options.audio ? 4 : 0)));
    const amf::Property width{"width", amf::Number(320)}, height{"height", amf::Number(240)};
    if (options.index)
        builder.indexed_metadata({width, height}, options.hook);
    else if (options.metadata)
        builder.metadata({width, height, {"framerate", amf::Number(25)}});
    if (options.video)
        builder.video(options.first_ts, AvcConfig(SmallAvcRecord()));
    if (options.audio)
        builder.audio(options.first_ts, AacConfig({0x12, 0x10}));
    for (uint32_t picture = 0, sounds = 0; picture < options.pictures; ++picture) {
        const Bytes data = AvcNalu(picture % options.gop == 0, Noise(300 + picture * 37 % 101, picture));
        if (options.video)
            builder.video(options.first_ts + picture * 40, data);
        for (; options.audio && sounds * 23 < (picture + 1) * 40; ++sounds)
            builder.audio(options.first_ts + sounds * 23, AacRaw(Noise(80 + sounds * 13 % 29, 1000 + sounds)));
    }
    return builder.build();
}

} // namespace flvd_test
