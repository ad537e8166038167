// A single tag. Files are read here without the library, which may have failed to open them.
#include "tools/tag.h"

#include <algorithm>
#include <array>
#include <cctype>
#include <fstream>
#include <vector>

#include <fmt/core.h>

namespace tool {

namespace {

constexpr int PROBED_TAGS = 102; // tags that the library searches for streams

// Reads the tags of a file from the first one on.
class RawTags {
public:
    explicit RawTags(const std::string& path) : m_file(path, std::ios::binary) {}

    // Returns fewer bytes than requested at the end of the file.
    std::vector<uint8_t> Bytes(int64_t position, size_t size)
    {
        std::vector<uint8_t> bytes(size);
        m_file.clear();
        m_file.seekg(position);
        m_file.read(reinterpret_cast<char*>(bytes.data()), static_cast<std::streamsize>(size));
        bytes.resize(static_cast<size_t>(m_file.gcount()));
        return bytes;
    }

    // Finds the first tag of the stream that has data; `number` is the number of tags before it.
    std::optional<Tag> FindFirst(flvdmx::Stream stream, int& number)
    {
        constexpr int MOST_TAGS = 10000; // several minutes
        constexpr int64_t DATA_OFFSET_POSITION = 5;
        const std::vector<uint8_t> offset = Bytes(DATA_OFFSET_POSITION, 4);
        int64_t position = offset.size() < 4 ? 0 : int64_t{BigEndian(offset.data(), 4)} + BACK_POINTER_SIZE;
        for (number = 0; number < MOST_TAGS; ++number) {
            const std::vector<uint8_t> bytes = Bytes(position, TAG_HEADER_SIZE + 2);
            if (bytes.size() < TAG_HEADER_SIZE)
                break;
            const Tag tag = Tag::Parse(position, bytes.data(), bytes.size());
            if (!tag.HasKnownType())
                break;
            if (!tag.IsScript() && tag.Stream() == stream && tag.size > 0)
                return tag;
            position = tag.End();
        }
        return std::nullopt;
    }

private:
    std::ifstream m_file;
};

// What is wrong with an AVC configuration that the library rejects.
std::string ConfigFault(RawTags& tags, const Tag& tag)
{
    constexpr uint32_t SETS_OFFSET = 6; // of the first set's length in the record
    const std::vector<uint8_t> record =
        tags.Bytes(tag.position + TAG_HEADER_SIZE + tag.CodecHeaderSize(), SETS_OFFSET + 2);
    if (record.size() < SETS_OFFSET + 2 || tag.size < tag.CodecHeaderSize() + SETS_OFFSET + 2)
        return "its AVC configuration is cut short";
    const uint32_t size = BigEndian(record.data() + SETS_OFFSET, 2);
    if (size > MOST_SET_BYTES || tag.size > MOST_SET_BYTES + tag.CodecHeaderSize())
        return fmt::format("its AVC parameter sets are larger than the supported {} bytes", MOST_SET_BYTES);
    return "its AVC configuration is damaged";
}

std::string Reason(RawTags& tags, const Tag& tag, int number)
{
    const std::vector<uint8_t> bytes = tags.Bytes(tag.position + TAG_HEADER_SIZE + 1, FOURCC_SIZE);
    const std::string_view fourcc(reinterpret_cast<const char*>(bytes.data()), bytes.size());
    const std::string codec = CodecOf(tag, fourcc);
    const std::vector<uint8_t> back = tags.Bytes(tag.DataEnd(), BACK_POINTER_SIZE);
    if (back.size() < BACK_POINTER_SIZE || BigEndian(back.data(), BACK_POINTER_SIZE) != tag.size + TAG_HEADER_SIZE)
        return "the back-pointer of its first tag is wrong";
    if (tag.IsExtended())
        return IsEnhanced(tag, fourcc) ? "it is " + codec
                                       : fmt::format("its first tag has an invalid codec byte: 0x{:02x}", tag.codec);
    if (number >= PROBED_TAGS)
        return fmt::format("it starts after the first {} tags, the only ones that are searched for streams",
                           PROBED_TAGS);
    if (!tag.IsAvc())
        return fmt::format("its first tag, {}, has no valid codec header", codec);
    return tag.IsConfig() ? ConfigFault(tags, tag) : "it does not start with its AVC configuration";
}

} // namespace

uint32_t BigEndian(const uint8_t* bytes, uint32_t size)
{
    uint32_t value = 0;
    for (uint32_t i = 0; i < size; ++i)
        value = value << 8 | bytes[i];
    return value;
}

Tag Tag::Parse(int64_t position, const uint8_t* bytes, size_t available)
{
    constexpr uint32_t STREAM_ID_OFFSET = 8;
    Tag tag{};
    tag.position = position;
    tag.type = bytes[0];
    tag.size = BigEndian(bytes + 1, 3);
    tag.timestamp = BigEndian(bytes + 4, 3) | static_cast<uint32_t>(bytes[7]) << 24;
    tag.streamId = BigEndian(bytes + STREAM_ID_OFFSET, 3);
    if (tag.size > 0 && available > TAG_HEADER_SIZE)
        tag.codec = bytes[TAG_HEADER_SIZE];
    if (tag.size > 1 && available > TAG_HEADER_SIZE + 1)
        tag.packetType = bytes[TAG_HEADER_SIZE + 1];
    return tag;
}

// False for codec configurations and for the end of an AVC sequence.
bool Tag::IsFrame() const
{
    if ((!IsVideo() && !IsAudio()) || size < CodecHeaderSize())
        return false;
    return !IsConfig() && !(IsAvc() && packetType == 2);
}

// CodecID 12 and 13 belong to no standard, but encoders have written them for years.
std::string CodecName(flvdmx::VideoCodec codec)
{
    const auto id = static_cast<uint32_t>(codec);
    const std::string name = flvdmx::name(codec);
    return name != "unknown" ? name : fmt::format("{} (CodecID {})", id == 12 ? "HEVC" : id == 13 ? "AV1" : name, id);
}

std::string CodecName(flvdmx::AudioCodec codec)
{
    const std::string name = flvdmx::name(codec);
    return name == "unknown" ? fmt::format("unknown (SoundFormat {})", static_cast<uint32_t>(codec)) : name;
}

bool IsEnhanced(const Tag& tag, std::string_view fourcc)
{
    return tag.IsExtended() && fourcc.size() == FOURCC_SIZE &&
           std::all_of(fourcc.begin(), fourcc.end(), [](unsigned char c) { return std::isalnum(c) != 0; });
}

std::string CodecOf(const Tag& tag, std::string_view fourcc)
{
    constexpr std::array<std::array<std::string_view, 2>, 4> NAMES = {
        {{"hvc1", "HEVC, "}, {"av01", "AV1, "}, {"vp09", "VP9, "}, {"avc1", "AVC, "}}};
    if (!IsEnhanced(tag, fourcc))
        return tag.IsVideo() ? CodecName(tag.VideoCodec()) : CodecName(tag.AudioCodec());
    const auto* const named =
        std::find_if(NAMES.begin(), NAMES.end(), [=](const auto& name) { return name[0] == fourcc; });
    return fmt::format("enhanced FLV ({}FourCC '{}')", named == NAMES.end() ? "" : (*named)[1], fourcc);
}

std::string WhyNoStream(const std::string& path, flvdmx::Stream stream)
{
    RawTags tags(path);
    int number = 0;
    const std::optional<Tag> first = tags.FindFirst(stream, number);
    return first ? Reason(tags, *first, number) : "";
}

// If no stream was found, there is a reason for each. If a stream was found but none of its frames, the file is
// enhanced FLV, or damaged in a way that is not known here.
std::string WhyNothingIsPlayed(const std::string& path, int32_t code)
{
    std::string text;
    if (code != FLVD_ERR_NO_STREAM && code != FLVD_ERR_EXTENT)
        return text;
    RawTags tags(path);
    for (const auto& [stream, name] : {std::pair(flvdmx::Stream::video, "video"), {flvdmx::Stream::audio, "audio"}}) {
        int number = 0;
        const std::optional<Tag> first = tags.FindFirst(stream, number);
        if (first && (code == FLVD_ERR_NO_STREAM || first->IsExtended()))
            text += fmt::format("; {}: {}", name, Reason(tags, *first, number));
    }
    return text.empty() ? text : "no stream can be played" + text;
}

} // namespace tool
