#include "expected.h"

#include "tools/crc32.h"

#include <fstream>
#include <iterator>
#include <map>
#include <sstream>
#include <stdexcept>

namespace flvd_test {

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

static Bytes FromHex(const std::string& text)
{
    Bytes out;
    for (size_t i = 0; i + 1 < text.size(); i += 2)
        out.push_back(static_cast<uint8_t>(std::stoul(text.substr(i, 2), nullptr, 16)));
    return out;
}

// Each line is a kind and fields, key=value.
Expected ReadExpected(const std::string& name)
{
    std::ifstream in = OpenData("expected/" + name + ".txt");
    Expected out;
    for (std::string text, kind; std::getline(in, text);) {
        std::istringstream line(text);
        std::map<std::string, std::string> fields;
        line >> kind;
        for (std::string field; line >> field;)
            fields[field.substr(0, field.find('='))] = field.substr(field.find('=') + 1);
        const auto number = [&fields](const char* key, int base = 10) {
            return static_cast<uint32_t>(std::stoul(fields.at(key), nullptr, base));
        };
        const uint32_t stream = fields["kind"] == "video" ? 1 : 2;
        if (kind == "file")
            out.file_size = number("size");
        else if (kind == "stream")
            out.streams.push_back({stream, number("width"), number("rate"), FromHex(fields.at("extradata"))});
        else if (kind == "packet")
            out.packets.push_back({stream, number("pos"), number("dts"), number("size"), number("crc", 16)});
    }
    return out;
}

bool SameFrame(const ExpectedPacket& packet, const Frame& frame)
{
    return packet.stream == frame.stream && packet.timestamp == frame.timestamp && packet.size == frame.data.size() &&
           packet.crc == tool::Crc32(frame.data.data(), frame.data.size());
}

} // namespace flvd_test
