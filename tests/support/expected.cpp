#include "expected.h"

#include "tools/crc32.h"

#include <fstream>
#include <iterator>
#include <map>
#include <sstream>
#include <stdexcept>

namespace flvd_test {

static std::string ReadData(const std::string& name)
{
    std::ifstream in(std::string(FLVDMX_TEST_DATA) + "/" + name, std::ios::binary);
    if (!in)
        throw std::runtime_error("cannot read " + name);
    return {std::istreambuf_iterator<char>(in), {}};
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
    const std::string sample = ReadData(name + ".flv");
    std::istringstream in(ReadData("expected/" + name + ".txt"));
    Expected out{{Bytes(sample.begin(), sample.end()), {}}, name, {}};
    for (std::string text, kind; std::getline(in, text);) {
        std::istringstream line(text);
        std::map<std::string, std::string> fields;
        line >> kind;
        for (std::string field; line >> field;)
            fields[field.substr(0, field.find('='))] = field.substr(field.find('=') + 1);
        const auto number = [&fields](const char* key, int base = 10) {
            return static_cast<uint32_t>(std::stoul(fields.at(key), nullptr, base));
        };
        if (kind == "stream")
            out.streams.push_back({fields["kind"] == "video" ? 1u : 2u, number("width"), number("rate"),
                                   FromHex(fields.at("extradata"))});
        if (kind != "packet")
            continue;
        const uint8_t* const at = &out.bytes.at(number("pos"));
        const Bytes data(at + 11, at + 11 + (at[1] << 16 | at[2] << 8 | at[3]));
        const Tag& tag = out.tags.emplace_back(Tag{*at, number("dts"), data, {}, {}, 0, number("pos")});
        const size_t size = number("size");
        if (data.size() != tag.codec_bytes() + size || tool::Crc32(&data[tag.codec_bytes()], size) != number("crc", 16))
            throw std::runtime_error(name + ": another packet at " + fields["pos"]);
    }
    return out;
}

} // namespace flvd_test
