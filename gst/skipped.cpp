// Tags (FLV file format, version 10.1, annex E.4.1), read without the library, which may have skipped them.

#include "skipped.h"

#include <array>

namespace flvdmx_gst {

namespace {

bool is_late(const flvdmx::Tag& tag, const flvdmx::File& file)
{
    return tag.stream() != flvdmx::Stream::any && tag.timestamp() > file.instance()->last_ts;
}

} // namespace

std::optional<flvdmx::Tag> read_tag(Source& source, int64_t position)
{
    std::array<uint8_t, flvdmx::Tag::header_size + 1> header{}; // and the codec byte
    std::array<uint8_t, flvdmx::Tag::back_pointer_size> back{};
    if (!source.read_all(position, header.data(), header.size()))
        return std::nullopt;
    const flvdmx::Tag tag(position, {header.data(), header.size()});
    if ((tag.stream() == flvdmx::Stream::any && !tag.is_script()) || tag.data_size() == 0 ||
        !source.read_all(tag.data_end(), back.data(), back.size()))
        return std::nullopt;
    const uint32_t size = uint32_t{back[0]} << 24 | uint32_t{back[1]} << 16 | uint32_t{back[2]} << 8 | back[3];
    return size == flvdmx::Tag::header_size + tag.data_size() ? std::optional(tag) : std::nullopt;
}

bool is_before_restart(Source& source, int64_t position, const flvdmx::File& file)
{
    if (file.instance()->last_ts == 0) // any time is valid
        return false;
    std::optional<flvdmx::Tag> tag;
    bool late = false;
    for (int i = 0; i < examined_tags && (tag = read_tag(source, position)); ++i, position = tag->end()) {
        const bool follows_late = late;
        late = is_late(*tag, file);
        if (late && follows_late)
            return true;
    }
    return false;
}

std::string reason_to_skip(const flvdmx::Tag& tag, const flvdmx::File& file, const flvdmx::Info& info)
{
    using namespace std::string_literals;
    if (tag.stream() == flvdmx::Stream::any)
        return "";
    const bool video = tag.stream() == flvdmx::Stream::video;
    const char* const codec = video ? flvdmx::name(tag.video_codec()) : flvdmx::name(tag.audio_codec());
    if (video && !info.video && tag.video_codec() == flvdmx::VideoCodec::avc)
        return "the video is not played: its first tags contain no usable AVC configuration";
    if (video ? !info.video : !info.audio)
        return (video ? "the video"s : "the audio"s) +
               " is not played: none was found among the first tags of the file (" + codec + ")";
    if (video && tag.video_codec() != info.video->codec)
        return "video is not played: its codec changes from "s + flvdmx::name(info.video->codec) + " to " + codec;
    if (!video && tag.audio_codec() != info.audio->codec)
        return "audio is not played: its codec changes from "s + flvdmx::name(info.audio->codec) + " to " + codec;
    if (!video && tag.codec_byte() != (file.instance()->audio_format_filter & 0xFF))
        return "audio is not played: its sample rate, sample size or channels change";
    return "";
}

} // namespace flvdmx_gst
