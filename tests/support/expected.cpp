#include "expected.h"

#include <fstream>
#include <iterator>
#include <map>
#include <sstream>
#include <stdexcept>

namespace flvd_test {

// CRC-32 of zlib and of ffmpeg's -show_data_hash.
static uint32_t Crc32(const Bytes& bytes)
{
    constexpr uint32_t POLYNOMIAL = 0xEDB88320;
    uint32_t crc = UINT32_MAX;
    for (const uint8_t byte : bytes) {
        crc ^= byte;
        for (int bit = 0; bit < 8; ++bit)
            crc = crc >> 1 ^ ((crc & 1u) != 0 ? POLYNOMIAL : 0);
    }
    return ~crc;
}

static std::ifstream OpenData(const std::string& name)
{
    std::ifstream in(std::string(FLVDMX_TEST_DATA) + "/" + name, std::ios::binary);
    if (!in)
        throw std::runtime_error("cannot read " + name);
    return in;
}

Bytes ReadSample(const std::string& name)
{
    std::ifstream in = OpenData(name);
    return Bytes(std::istreambuf_iterator<char>(in), {});
}

// key=value fields of one line behind its kind.
class Fields {
public:
    explicit Fields(std::istringstream& line)
    {
        for (std::string field; line >> field;)
            m_values[field.substr(0, field.find('='))] = field.substr(field.find('=') + 1);
    }
    const std::string& text(const char* key) const { return m_values.at(key); }
    uint32_t number(const char* key, int base = 10) const
    {
        return static_cast<uint32_t>(std::stoul(text(key), nullptr, base));
    }
    uint32_t stream() const { return text("kind") == "video" ? 1u : 2u; }
    Bytes hex(const char* key) const
    {
        Bytes out;
        for (size_t i = 0; i + 1 < text(key).size(); i += 2)
            out.push_back(static_cast<uint8_t>(std::stoul(text(key).substr(i, 2), nullptr, 16)));
        return out;
    }

private:
    std::map<std::string, std::string> m_values;
};

Expected ReadExpected(const std::string& name)
{
    std::ifstream in = OpenData("expected/" + name + ".txt");
    Expected out;
    for (std::string text; std::getline(in, text);) {
        std::istringstream line(text);
        std::string kind;
        line >> kind;
        const Fields f(line);
        if (kind == "file") {
            out.file_size = f.number("size");
        } else if (kind == "stream") {
            out.streams.push_back({f.stream(), f.text("codec"), f.number("width"), f.number("height"), f.number("rate"),
                                   f.number("channels"), f.hex("extradata")});
        } else if (kind == "packet") {
            out.packets.push_back({f.stream(), f.number("pos"), f.number("dts"), f.number("size"), f.number("crc", 16),
                                   f.number("key") != 0});
        }
    }
    return out;
}

const ExpectedStream* Expected::find(uint32_t stream) const
{
    for (const ExpectedStream& candidate : streams)
        if (candidate.stream == stream)
            return &candidate;
    return nullptr;
}

bool SameFrame(const ExpectedPacket& packet, const Frame& frame, uint32_t first_ts)
{
    return packet.stream == frame.stream && packet.size == frame.data.size() &&
           packet.timestamp - first_ts == frame.timestamp && packet.crc == Crc32(frame.data);
}

} // namespace flvd_test
