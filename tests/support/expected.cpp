#include "expected.h"

#include <fstream>
#include <iterator>
#include <map>
#include <sstream>
#include <stdexcept>

#include <boost/crc.hpp>

namespace flvd_test {

static void Require(bool holds, const std::string& otherwise)
{
    if (!holds)
        throw std::runtime_error(otherwise);
}

static std::string ReadData(const std::string& name)
{
    std::ifstream in(std::string(FLVDMX_TEST_DATA) + "/" + name, std::ios::binary);
    Require(in.good(), "cannot read " + name);
    return {std::istreambuf_iterator<char>(in), {}};
}

static Bytes FromHex(const std::string& text)
{
    Bytes out;
    for (size_t i = 0; i + 1 < text.size(); i += 2)
        out.push_back(static_cast<uint8_t>(std::stoul(text.substr(i, 2), nullptr, 16)));
    return out;
}

uint32_t Crc32(const Bytes& bytes)
{
    boost::crc_32_type crc;
    crc.process_bytes(bytes.data(), bytes.size());
    return crc.checksum();
}

// Each line is a kind and fields, key=value.
Expected ReadExpected(const std::string& name)
{
    const std::string sample = ReadData(name + ".flv");
    std::istringstream in(ReadData("expected/" + name + ".txt"));
    Expected out{{Bytes(sample.begin(), sample.end()), {}}, name, {}, {}};
    for (std::string text, kind; std::getline(in, text);) {
        std::istringstream line(text);
        std::map<std::string, std::string> fields;
        line >> kind;
        for (std::string field; line >> field;)
            fields[field.substr(0, field.find('='))] = field.substr(field.find('=') + 1);
        const auto number = [&fields](const char* key, int base = 10) {
            return static_cast<uint32_t>(std::stoul(fields.at(key), nullptr, base));
        };
        const bool video = fields["kind"] == "video";
        if (kind == "stream")
            out.streams.push_back(
                {video ? 1u : 2u, fields["codec"], number("width"), number("rate"), FromHex(fields.at("extradata"))});
        if (kind == "file")
            Require(number("size") == out.bytes.size(), name + " has a wrong size");
        if (kind != "packet")
            continue;
        const size_t pos = number("pos");
        const uint8_t* const at = &out.bytes.at(pos + 14) - 14; // includes header and back-pointer
        const auto length = static_cast<size_t>(at[1] << 16 | at[2] << 8 | at[3]);
        const uint8_t* const end = &out.bytes.at(pos + 14 + length) - 3;
        const Tag tag{*at, number("dts"), {at + 11, end}, {}, {}, static_cast<int64_t>(pos)};
        const Bytes frame = tag.frame();
        Require(tag.type == (video ? 9 : 8) && frame.size() == number("size") && Crc32(frame) == number("crc", 16),
                name + ": wrong packet at " + fields["pos"]);
        out.tags.push_back(tag);
        out.packets.push_back({number("pts"), number("key") != 0});
    }
    return out;
}

std::vector<std::vector<std::string>> ReadTable(const std::string& name)
{
    std::vector<std::vector<std::string>> rows;
    std::istringstream in(ReadData(name));
    for (std::string line; std::getline(in, line);) {
        if (line.empty() || line[0] == '#')
            continue;
        auto& row = rows.emplace_back();
        for (size_t at = 0, bar = 0; bar != std::string::npos; at = bar + 3) {
            bar = line.find(" | ", at);
            row.push_back(line.substr(at, bar - at));
        }
    }
    Require(!rows.empty(), name + " has no rows");
    return rows;
}

} // namespace flvd_test
