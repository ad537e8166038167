#include "flv_writer.h"

#include <algorithm>
#include <bit>
#include <bitset>
#include <iomanip>
#include <map>
#include <sstream>

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

Bytes Bits(const std::string& words)
{
    const auto binary = [](int64_t n) { return std::bitset<64>(static_cast<uint64_t>(n)).to_string(); };
    std::string bits;
    std::istringstream in(words);
    for (std::string word; in >> word;) {
        const size_t star = word.find('*'), slash = word.find('/');
        const std::string number = word.substr(star + 1); // the whole word if there is no star
        const bool is_signed = number[0] == '+' || number[0] == '-';
        const int64_t n = std::stoll(number, nullptr, 0);
        std::string code = binary(!is_signed ? n + 1 : n > 0 ? 2 * n : 1 - 2 * n);
        code.erase(0, code.find('1'));
        code.insert(0, code.size() - 1, '0');
        if (slash != std::string::npos)
            code = binary(n).substr(64 - std::stoul(word.substr(slash + 1)));
        for (int times = star != std::string::npos ? std::stoi(word) : 1; times != 0; --times)
            bits += code;
    }
    Bytes out;
    bits.append(7, '0');
    for (size_t at = 0; at + 8 <= bits.size(); at += 8)
        out.push_back(static_cast<uint8_t>(std::bitset<8>(bits, at, 8).to_ulong()));
    return out;
}

Bytes Amf(const std::string& words)
{
    const std::map<std::string, Bytes> marks = {
        {"{", {3}}, {"<", {8, 0, 0, 0, 9}}, {"}", {0, 0, 9}}, {">", {0, 0, 9}}, {"!", {12, 0x7F, 0xFF, 0xFF, 0xFB}}};
    Bytes out;
    std::istringstream in(words);
    for (std::string word; in >> word;) {
        if (const size_t at = word.find('^'); at != std::string::npos) {
            size_t digits = 0;
            const size_t count = std::stoul(word.substr(at + 1), &digits);
            word.replace(at, digits + 1, count - 1, word[at - 1]);
        }
        const Bytes text(word.begin() + 1, word.end()), key(word.begin(), word.end() - 1);
        if (marks.contains(word))
            Append(out, marks.at(word));
        else if (word.back() == ':')
            Append(out, Concat({BigEndian(key.size(), 2), key}));
        else if (word[0] == '\'')
            Append(out, Concat({{2}, BigEndian(text.size(), 2), text}));
        else if (word[0] == '"')
            Append(out, Concat({{12}, BigEndian(text.size(), 4), text}));
        else if (word[0] == '[')
            Append(out, Concat({{10}, BigEndian(std::stoul(word.substr(1)), 4)}));
        else if (word[0] != '%')
            Append(out, Concat({{0}, BigEndian(std::bit_cast<uint64_t>(std::stod(word)), 8)}));
        else
            for (size_t at = 0; at != std::string::npos; at = word.find('.', at + 1))
                out.push_back(static_cast<uint8_t>(std::stoul(word.substr(at + 1))));
    }
    return out;
}

Bytes AvcNalu(bool key, const Bytes& payload, int32_t composition_ms, uint8_t packet_type)
{
    const auto first = static_cast<uint8_t>(key ? 0x17 : 0x27);
    return Concat({{first, packet_type}, BigEndian(static_cast<uint32_t>(composition_ms), 3), payload});
}

Bytes AvcRecord(const std::vector<Bytes>& sps, const std::vector<Bytes>& pps)
{
    Bytes out{1, 0x42, 0xC0, 0x28, 0xFF};
    for (const auto& [count, sets] : {std::pair(0xE0 | sps.size(), sps), {pps.size(), pps}}) {
        out.push_back(static_cast<uint8_t>(count));
        for (const Bytes& set : sets)
            Append(out, Concat({BigEndian(set.size(), 2), set}));
    }
    return out;
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
    for (const Tag& tag : tags)
        if (tag.is_frame() && (tag.stream() & streams) != 0)
            out.push_back({tag.stream(), tag.timestamp - first, tag.frame()});
    return out;
}

static Bytes IndexData(const Tags& tags, const IndexHook& hook, const std::string& properties)
{
    std::vector<double> times, positions;
    for (const Tag& tag : tags)
        if (tag.is_keyframe()) {
            times.push_back(tag.timestamp / 1000.0);
            positions.push_back(static_cast<double>(tag.offset));
        }
    if (hook)
        hook(times, positions);
    std::ostringstream words;
    words << std::setprecision(17) << properties << " keyframes: { ";
    for (const auto& [key, numbers] : {std::pair("times: [", times), {"filepositions: [", positions}}) {
        words << key << numbers.size();
        for (const double number : numbers)
            words << ' ' << number;
        words << ' ';
    }
    words << '}';
    return OnMetaData(words.str());
}

Flv File(const Tags& tags, uint8_t flags, const Bytes& prefix, uint32_t header)
{
    const uint32_t data_offset = static_cast<uint32_t>(prefix.size()) + header;
    Flv flv{Concat({prefix, {'F', 'L', 'V', 1, flags}, BigEndian(data_offset, 4)}), tags};
    if (flv.bytes.size() < data_offset && data_offset < 0x10000)
        flv.bytes.resize(data_offset);
    Append(flv.bytes, Bytes(4));
    for (Tag& tag : flv.tags) {
        const size_t size = tag.data.size();
        tag.offset = static_cast<int64_t>(flv.bytes.size());
        Append(flv.bytes, Concat({{tag.type},
                                  BigEndian(tag.data_size.value_or(size), 3),
                                  BigEndian(uint64_t{tag.timestamp} << 8 | tag.timestamp >> 24, 4),
                                  BigEndian(0, 3), // StreamID
                                  tag.data,
                                  BigEndian(tag.back_pointer.value_or(size + 11), 4)}));
    }
    return flv;
}

// AMF0 numbers have a fixed size, so filling in the index does not change the layout.
Flv IndexedFile(const Tags& tags, const IndexHook& hook, const std::string& properties, uint8_t flags)
{
    Flv flv = File(Tags{{18, 0, {}}} + tags, flags);
    for (int pass = 0; pass < 2; ++pass) {
        flv.tags[0].data = IndexData(flv.tags, hook, properties);
        flv = File(flv.tags, flags);
    }
    return flv;
}

Flv MakeChain(const ChainOptions& options)
{
    Tags tags;
    if (options.metadata && !options.index)
        tags.push_back({18, 0, OnMetaData("width: 320 height: 240 framerate: 25")});
    if (options.video)
        tags.push_back({9, options.first_ts, AvcConfig(SmallAvcRecord())});
    if (options.audio)
        tags.push_back({8, options.first_ts, AacConfig({0x12, 0x10})});
    for (uint32_t picture = 0, audio = 0; picture < options.pictures; ++picture) {
        const Bytes data = AvcNalu(picture % options.gop == 0, Noise(300 + picture * 37 % 101, picture));
        if (options.video)
            tags.push_back({9, options.first_ts + picture * 40, data});
        for (; options.audio && audio * 23 < (picture + 1) * 40; ++audio)
            tags.push_back({8, options.first_ts + audio * 23, AacRaw(Noise(80 + audio * 13 % 29, 1000 + audio))});
    }
    const auto flags = static_cast<uint8_t>((options.video ? 1 : 0) | (options.audio ? 4 : 0));
    return options.index ? IndexedFile(tags, options.hook, "width: 320 height: 240", flags) : File(tags, flags);
}

} // namespace flvd_test
