#include "caps.h"

#include <gst/pbutils/pbutils.h>
#include <gst/video/video.h>

#include <array>

namespace flvdmx_gst {

namespace {

using flvdmx::AudioCodec;
using flvdmx::VideoCodec;

struct VideoCaps {
    VideoCodec codec;
    const char* caps;
};

constexpr VideoCaps video_table[] = {
    {VideoCodec::sorenson_h263, "video/x-flash-video, flvversion=(int)1"},
    {VideoCodec::screen_video, "video/x-flash-screen"},
    {VideoCodec::vp6, "video/x-vp6-flash"},
    {VideoCodec::vp6_alpha, "video/x-vp6-alpha"},
    {VideoCodec::screen_video_2, "video/x-flash-screen2"},
    {VideoCodec::avc, "video/x-h264, stream-format=(string)avc, alignment=(string)au"},
};

struct AudioCaps {
    AudioCodec codec;
    uint32_t sample_rate; // the codec's own; 0: as the tag header states
    uint32_t channels;    // likewise
    const char* caps;
};

constexpr double frame_rate_min = 0.01; // per second
constexpr const char* pcm_caps = "audio/x-raw, format=(string){ U8, S16LE }, layout=(string)interleaved";
constexpr const char* mp3_caps = "audio/mpeg, mpegversion=(int)1, layer=(int)3, parsed=(boolean)true";

constexpr AudioCaps audio_table[] = {
    {AudioCodec::pcm, 0, 0, pcm_caps}, // in practice little-endian
    {AudioCodec::adpcm, 0, 0, "audio/x-adpcm, layout=(string)swf"},
    {AudioCodec::mp3, 0, 0, mp3_caps},
    {AudioCodec::pcm_little_endian, 0, 0, pcm_caps},
    {AudioCodec::nellymoser_16khz, 16000, 1, "audio/x-nellymoser"},
    {AudioCodec::nellymoser_8khz, 8000, 1, "audio/x-nellymoser"},
    {AudioCodec::nellymoser, 0, 0, "audio/x-nellymoser"},
    {AudioCodec::a_law, 8000, 0, "audio/x-alaw"},
    {AudioCodec::mu_law, 8000, 0, "audio/x-mulaw"},
    {AudioCodec::aac, 0, 0, "audio/mpeg, mpegversion=(int)4, framed=(boolean)true, stream-format=(string)raw"},
    {AudioCodec::speex, 16000, 1, "audio/x-speex"},
    {AudioCodec::mp3_8khz, 8000, 0, mp3_caps},
};

template <typename Row, size_t count, typename Codec> const Row* find_row(const Row (&table)[count], Codec codec)
{
    for (const Row& row : table)
        if (row.codec == codec)
            return &row;
    return nullptr;
}

template <typename Row, size_t count> GstCaps* template_caps(const Row (&table)[count])
{
    GstCaps* caps = gst_caps_new_empty();
    for (const Row& row : table)
        caps = gst_caps_merge(caps, gst_caps_from_string(row.caps));
    return caps;
}

GstBuffer* copy_to_buffer(const void* bytes, size_t size)
{
    GstBuffer* const buffer = gst_buffer_new_allocate(nullptr, size, nullptr);
    gst_buffer_fill(buffer, 0, bytes, size);
    return buffer;
}

void set_config(GstCaps* caps, const std::vector<uint8_t>& config)
{
    GstBuffer* const buffer = copy_to_buffer(config.data(), config.size());
    gst_caps_set_simple(caps, "codec_data", GST_TYPE_BUFFER, buffer, nullptr);
    gst_buffer_unref(buffer);
}

void set_number(GstCaps* caps, const char* field, uint32_t value)
{
    if (value != 0)
        gst_caps_set_simple(caps, field, G_TYPE_INT, static_cast<gint>(value), nullptr);
}

// The metadata states 29.97 for 30000/1001.
void set_frame_rate(GstCaps* caps, double rate)
{
    gint numerator = 0;
    gint denominator = 1;
    if (rate < frame_rate_min)
        return;
    if (gst_video_guess_framerate(static_cast<GstClockTime>(GST_SECOND / rate), &numerator, &denominator) == FALSE)
        gst_util_double_to_fraction(rate, &numerator, &denominator);
    gst_caps_set_simple(caps, "framerate", GST_TYPE_FRACTION, numerator, denominator, nullptr);
}

// The stream header of Speex (The Speex Codec Manual, section 8). FLV omits it, since all its Speex audio is wideband
// and mono, with one frame of 320 samples per packet. A comment follows that names only the vendor, as in a Vorbis
// stream.
void set_speex_header(GstCaps* caps)
{
    constexpr std::array<uint8_t, 80> header = {
        'S',  'p',  'e',  'e',  'x', ' ', ' ', ' ', '1', '.', '2', 0, 0, 0, 0, 0, // speex_string, speex_version
        0,    0,    0,    0,    0,   0,   0,   0,   0,   0,   0,   0,             // up to 20 bytes of version
        1,    0,    0,    0,                                                      // speex_version_id
        80,   0,    0,    0,                                                      // header_size
        0x80, 0x3E, 0,    0,                                                      // rate: 16000
        1,    0,    0,    0,                                                      // mode: wideband
        4,    0,    0,    0,                                                      // mode_bitstream_version
        1,    0,    0,    0,                                                      // nb_channels
        0xFF, 0xFF, 0xFF, 0xFF,                                                   // bitrate: unknown
        0x40, 1,    0,    0,                                                      // frame_size: 320
        0,    0,    0,    0,                                                      // vbr
        1,    0,    0,    0,                                                      // frames_per_packet
    };
    constexpr std::array<uint8_t, 15> comment = {6,   0,   0, 0, 'f', 'l', 'v', 'd', // vendor_length, vendor_string
                                                 'm', 'x', 0, 0, 0,   0,   1};       // no comments, framing bit
    GValue array = G_VALUE_INIT;
    gst_value_array_init(&array, 2);
    const auto append = [&array](const auto& bytes) {
        GValue value = G_VALUE_INIT;
        g_value_init(&value, GST_TYPE_BUFFER);
        gst_value_take_buffer(&value, copy_to_buffer(bytes.data(), bytes.size()));
        gst_value_array_append_and_take_value(&array, &value);
    };
    append(header);
    append(comment);
    gst_caps_set_value(caps, "streamheader", &array);
    g_value_unset(&array);
}

} // namespace

GstCaps* video_template_caps()
{
    return template_caps(video_table);
}

GstCaps* audio_template_caps()
{
    return template_caps(audio_table);
}

GstCaps* make_caps(const flvdmx::VideoInfo& info)
{
    constexpr size_t profile_offset = 1; // in an AVCDecoderConfigurationRecord
    constexpr size_t profile_size = 3;
    constexpr uint8_t high_444 = 244; // the library reads a wrong picture size for this profile
    const VideoCaps* const row = find_row(video_table, info.codec);
    const bool is_avc = info.codec == VideoCodec::avc;
    if (row == nullptr || (is_avc && info.config.size() < profile_offset + profile_size))
        return nullptr;
    GstCaps* const caps = gst_caps_from_string(row->caps);
    if (!is_avc || info.config[profile_offset] != high_444) {
        set_number(caps, "width", info.width);
        set_number(caps, "height", info.height);
    }
    set_frame_rate(caps, info.frame_rate);
    if (is_avc) {
        set_config(caps, info.config);
        gst_codec_utils_h264_caps_set_level_and_profile(caps, info.config.data() + profile_offset, profile_size);
    }
    return caps;
}

GstCaps* make_caps(const flvdmx::AudioInfo& info)
{
    const AudioCaps* const row = find_row(audio_table, info.codec);
    const bool is_aac = info.codec == AudioCodec::aac;
    if (row == nullptr || (is_aac && info.config.empty()))
        return nullptr;
    GstCaps* const caps = gst_caps_from_string(row->caps);
    set_number(caps, "rate", row->sample_rate != 0 ? row->sample_rate : info.sample_rate);
    set_number(caps, "channels", row->channels != 0 ? row->channels : info.channels);
    if (row->caps == pcm_caps)
        gst_caps_set_simple(caps, "format", G_TYPE_STRING, info.sample_size == 8 ? "U8" : "S16LE", nullptr);
    if (info.codec == AudioCodec::speex)
        set_speex_header(caps);
    if (is_aac) {
        set_config(caps, info.config);
        gst_codec_utils_aac_caps_set_level_and_profile(caps, info.config.data(),
                                                       static_cast<guint>(info.config.size()));
    }
    return caps;
}

} // namespace flvdmx_gst
