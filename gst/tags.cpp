#include "tags.h"

#include <gst/pbutils/pbutils.h>

#include <string>
#include <variant>

namespace flvdmx_gst {

namespace {

struct TextTag {
    const char* property; // muxers may write any; FLV players read these
    const char* tag;
};

constexpr TextTag text_tags[] = {
    {"title", GST_TAG_TITLE},
    {"creator", GST_TAG_ARTIST},
    {"artist", GST_TAG_ARTIST},
    {"album", GST_TAG_ALBUM},
    {"genre", GST_TAG_GENRE},
    {"description", GST_TAG_DESCRIPTION},
    {"comment", GST_TAG_COMMENT},
    {"copyright", GST_TAG_COPYRIGHT},
    {"encoder", GST_TAG_ENCODER},
    {"keywords", GST_TAG_KEYWORDS},
    {"metadatacreator", GST_TAG_ENCODER},
};

constexpr double bits_per_kbit = 1000.0;
constexpr double bit_rate_max = 4e9; // bits per second; more cannot be meant

} // namespace

GstTagList* make_file_tags(const flvdmx::Metadata& metadata)
{
    GstTagList* const tags = gst_tag_list_new_empty();
    gst_tag_list_set_scope(tags, GST_TAG_SCOPE_GLOBAL);
    gst_tag_list_add(tags, GST_TAG_MERGE_APPEND, GST_TAG_CONTAINER_FORMAT, "FLV", nullptr);
    for (const TextTag& row : text_tags) {
        const std::string text(metadata.text(row.property));
        if (!text.empty() && g_utf8_validate(text.data(), static_cast<gssize>(text.size()), nullptr) != FALSE)
            gst_tag_list_add(tags, GST_TAG_MERGE_KEEP, row.tag, text.c_str(), nullptr);
    }
    return tags;
}

GstTagList* make_stream_tags(const flvdmx::Metadata& metadata, flvdmx::Stream stream, const GstCaps* caps)
{
    const bool video = stream == flvdmx::Stream::video;
    GstTagList* const tags = gst_tag_list_new_empty();
    gst_pb_utils_add_codec_description_to_tag_list(tags, video ? GST_TAG_VIDEO_CODEC : GST_TAG_AUDIO_CODEC, caps);
    const flvdmx::Property* const rate = metadata.find(video ? "videodatarate" : "audiodatarate");
    const double* const kbits = rate != nullptr ? std::get_if<double>(&rate->value) : nullptr;
    if (kbits != nullptr && *kbits >= 1.0 && *kbits < bit_rate_max / bits_per_kbit)
        gst_tag_list_add(tags, GST_TAG_MERGE_APPEND, GST_TAG_BITRATE, static_cast<guint>(*kbits * bits_per_kbit),
                         nullptr);
    return tags;
}

} // namespace flvdmx_gst
