// What the element delivers, compared with the framework's own demuxer where that plays the file.

#include "pipeline.h"

#include "flvdmx/flvdmx.hpp"
#include "support/flv_writer.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <array>
#include <filesystem>
#include <fstream>
#include <functional>

namespace flvd_test {

namespace {

const std::string g_data = FLVDMX_TEST_DATA "/";

Bytes Sound(uint8_t header, size_t size)
{
    Tags tags;
    for (uint32_t i = 0; i < 20; ++i)
        tags.push_back({8, i * 40, AudioData(header, Noise(size, i + 1))});
    return File(tags, 4).bytes;
}

// Pictures of noise that can be decoded: simple profile, 6 x 4 macroblocks, as many in the alpha channel. The first
// byte crops them to 93 x 59.
Bytes Vp6(bool alpha)
{
    Tags tags = {{18, 0, OnMetaData("width: 88 height: 56")}};
    for (uint32_t i = 0; i < 10; ++i) {
        const Bytes picture = Concat({{0x28, 0x30, 2, 0, 4, 6, 4, 6}, Noise(1800, i + 1)});
        const Bytes before_alpha = alpha ? BigEndian(picture.size(), 3) : Bytes();
        const Bytes data = Concat({{0x88}, before_alpha, picture, alpha ? picture : Bytes()});
        tags.push_back({9, i * 40, VideoData(1, alpha ? CODEC_VP6A : CODEC_VP6, data)});
    }
    return File(tags, 1).bytes;
}

struct Medium {
    const char* name;
    bool video;
    bool audio;
    std::function<Bytes()> make = {}; // empty: the sample of that name
};

void PrintTo(const Medium& medium, std::ostream* out)
{
    *out << medium.name;
}

class Play : public testing::TestWithParam<Medium> {
public:
    // Returns the buffers decoded, or as they come out of the demuxer.
    static std::map<std::string, std::vector<Arrival>> play(const std::string& path, const char* demuxer, bool decodes)
    {
        const std::string decoder = decodes ? "decodebin ! " : "";
        const auto sink = [&](bool has, const char* name) {
            return has ? decoder + "appsink sync=false name=" + name : std::string();
        };
        Pipeline pipeline(demuxed(path, sink(GetParam().video, "v"), sink(GetParam().audio, "a"), demuxer));
        EXPECT_EQ(pipeline.play(), "") << demuxer;
        return {{"v", pipeline.arrivals("v")}, {"a", pipeline.arrivals("a")}};
    }
};

TEST_P(Play, DeliversWhatTheFrameworksOwnDemuxerDelivers)
{
    const TemporaryFile made(GetParam().make ? GetParam().make() : Bytes());
    const std::string path = GetParam().make ? made.path() : g_data + GetParam().name + ".flv";
    for (const bool decodes : {false, true}) {
        auto ours = play(path, "flvdmxdemux", decodes);
        auto theirs = play(path, "flvdemux", decodes);
        for (const auto& [stream, wanted] : {std::pair{"v", GetParam().video}, std::pair{"a", GetParam().audio}}) {
            SCOPED_TRACE(std::string(stream) + (decodes ? " decoded" : ""));
            ASSERT_EQ(ours[stream].size(), theirs[stream].size());
            EXPECT_EQ(ours[stream].size() > 3, wanted);
            for (size_t i = 0; i < ours[stream].size(); ++i) {
                const Arrival &one = ours[stream][i], &other = theirs[stream][i];
                ASSERT_EQ(one.checksum, other.checksum) << i;
                const bool cut = decodes && i == 0; // their decoder clips to the start of the segment
                ASSERT_TRUE(cut || one.pts == other.pts) << i;
                ASSERT_EQ(one.dts, other.dts) << i;
                ASSERT_EQ(one.delta, other.delta) << i;
                ASSERT_EQ(one.discont, i == 0) << i;
            }
        }
    }
}

INSTANTIATE_TEST_SUITE_P(Gst, Play,
                         testing::Values(Medium{"avc_aac", true, true}, Medium{"avc_aac_index", true, true},
                                         Medium{"avc_bframes_aac", true, true}, Medium{"avc_only", true, false},
                                         Medium{"h263_mp3", true, true}, Medium{"screen", true, false},
                                         Medium{"aac_only", false, true}, Medium{"mp3_only", false, true},
                                         Medium{"speex_only", false, true}, Medium{"pcm_only", false, true},
                                         Medium{"vp6", true, false, [] { return Vp6(false); }},
                                         Medium{"vp6_alpha", true, false, [] { return Vp6(true); }},
                                         Medium{"pcm_8_bits", false, true, [] { return Sound(0x0C, 400); }},
                                         Medium{"adpcm", false, true, [] { return Sound(0x1E, 400); }},
                                         Medium{"nellymoser", false, true, [] { return Sound(0x6A, 128); }},
                                         Medium{"nellymoser_16khz", false, true, [] { return Sound(0x4A, 64); }},
                                         Medium{"a_law", false, true, [] { return Sound(0x72, 160); }},
                                         Medium{"mu_law", false, true, [] { return Sound(0x82, 160); }}),
                         [](const testing::TestParamInfo<Medium>& i) { return std::string(i.param.name); });

// What arrives from a damaged file. Video and audio frames after damage are marked.
struct DamagedCase {
    const char* name;
    size_t pictures;
    size_t sounds;
    size_t discontinuities; // of the video, including the first picture
    std::function<void(const std::string& path)> make = {};
};

void PrintTo(const DamagedCase& damaged, std::ostream* out)
{
    *out << damaged.name;
}

// 200 MB, 2000 pictures. Eight holes of zeros cover five pictures each, one covers 25: more than 2 MiB.
void WriteHoles(const std::string& path)
{
    constexpr uint32_t pictures = 2000, picture_size = 100'000;
    std::ofstream out(path, std::ios::binary);
    const auto write = [&out](const Bytes& bytes) {
        out.write(reinterpret_cast<const char*>(bytes.data()), static_cast<std::streamsize>(bytes.size()));
    };
    write(File({g_avc}, 1).bytes);
    Bytes tag = File({Nalu(0, picture_size)}, 1).body();
    const Bytes zeros(tag.size());
    for (uint32_t i = 0; i < pictures; ++i) {
        const bool in_hole = (i % 200 >= 100 && i % 200 < 105 && i < 1600) || (i >= 1700 && i < 1725);
        const Bytes time = BigEndian(uint64_t{i} * 40, 3);
        std::copy(time.begin(), time.end(), tag.begin() + 4);
        write(in_hole ? zeros : tag);
    }
}

class Damaged : public testing::TestWithParam<DamagedCase> {};

TEST_P(Damaged, ContinuesToPlay)
{
    const DamagedCase& wanted = GetParam();
    const TemporaryFile made{Bytes()};
    if (wanted.make)
        wanted.make(made.path());
    const std::string path = wanted.make ? made.path() : g_data + wanted.name + ".flv";
    const auto sink = [](size_t count, const char* name) {
        return count != 0 ? std::string("appsink sync=false name=") + name : std::string();
    };
    Pipeline pipeline(demuxed(path, sink(wanted.pictures, "v"), sink(wanted.sounds, "a")));
    EXPECT_EQ(pipeline.play(), "");
    const std::vector<Arrival> video = pipeline.arrivals("v");
    EXPECT_EQ(video.size(), wanted.pictures);
    EXPECT_EQ(pipeline.arrivals("a").size(), wanted.sounds);
    EXPECT_EQ(std::count_if(video.begin(), video.end(), [](const Arrival& a) { return a.discont; }),
              static_cast<std::ptrdiff_t>(wanted.discontinuities));
}

INSTANTIATE_TEST_SUITE_P(Gst, Damaged,
                         testing::Values(DamagedCase{"damaged", 60, 104, 2}, DamagedCase{"truncated", 36, 62, 1},
                                         DamagedCase{"holes", 1935, 0, 10, WriteHoles}),
                         [](const testing::TestParamInfo<DamagedCase>& i) { return std::string(i.param.name); });

// Configurations that change within the file arrive as caps before the frames that need them. Equal ones do not, and
// the frames after them are not marked as discontinuous.
TEST(Playing, AnnouncesChangedConfigurations)
{
    const Tag other_sound = {8, 80, AacConfig({0x11, 0x90})};               // 48 kHz
    const Bytes small_picture = {0x67, 0x42, 0xC0, 0x28, 0xDA, 0x11, 0xE4}; // 64 x 48
    const Tag other_video = {9, 80, AvcConfig(AvcRecord({small_picture}, {{0x68, 0xCE, 0x3C, 0x80}}))};
    const TemporaryFile file(File({g_avc, g_aac, Nalu(0), Raw(0), g_avc, Nalu(40), Raw(40), other_sound, other_video,
                                   Nalu(80), Raw(80), Raw(120), Nalu(120)})
                                 .bytes);
    Pipeline pipeline(demuxed(file.path(), "appsink sync=false name=v", "appsink sync=false name=a"));
    ASSERT_EQ(pipeline.play(), "");
    const std::vector<Arrival> video = pipeline.arrivals("v"), audio = pipeline.arrivals("a");
    ASSERT_EQ(video.size(), 4u);
    ASSERT_EQ(audio.size(), 4u);
    for (size_t i = 0; i < 4; ++i) {
        EXPECT_NE(video[i].caps.find(i < 2 ? "width=(int)320, height=(int)240" : "width=(int)64, height=(int)48"),
                  std::string::npos)
            << video[i].caps;
        EXPECT_NE(audio[i].caps.find(i < 2 ? "rate=(int)44100" : "rate=(int)48000"), std::string::npos);
        EXPECT_EQ(video[i].discont, i == 0);
    }
}

// Recordings that were joined, cut or badly written: all frames arrive, and the times of a stream never go back. Where
// timestamps restart, the last audio frame before the restart may come after the first video frame after it.
TEST(Playing, PutsTimesInOrder)
{
    const auto pictures = [](const std::vector<uint32_t>& times) {
        Tags tags = {g_avc};
        std::transform(times.begin(), times.end(), std::back_inserter(tags), [](uint32_t time) { return Nalu(time); });
        return tags;
    };
    const Tag rate = {18, 0, OnMetaData("framerate: 29.97")}, screen = {9, 0, VideoData(1, 6, Noise(60))};
    const uint32_t wrap = 0xFFFFFFB0; // 80 ms before the timestamps exceed 32 bits
    const struct {
        Tags tags;
        std::vector<uint64_t> video, audio = {}; // ms
        const char* caps = "video/x-h264";
    } cases[] = {
        {.tags = pictures({0, 40, 2000, 2040, 0, 40}), .video = {0, 40, 2000, 2040, 2080, 2120}},
        {.tags = pictures({0, 40, 4000, 4040, 0, 40, 80}), .video = {0, 40, 4000, 4040, 4080, 4120, 4160}},
        {.tags = pictures({wrap, wrap + 40, 0, 40}), .video = {0, 40, 80, 120}},
        {.tags = Tags{g_meta} + pictures({20, 0, 40}), .video = {0, 0, 20}}, // the first frame is not the earliest
        {.tags = {g_avc, Nalu(0), {9, 40, AvcNalu(false, {})}, Nalu(80)}, .video = {0, 80}}, // one frame is empty
        {.tags = {rate, g_avc, Nalu(0)}, .video = {0}, .caps = "framerate=(fraction)30000/1001"},
        {.tags = {screen}, .video = {0}, .caps = "video/x-flash-screen2"},
        {.tags = {g_avc, g_aac, Nalu(wrap), Raw(wrap), Nalu(wrap + 40), Nalu(0), Raw(wrap + 46), Raw(12), Nalu(40),
                  Raw(58)},
         .video = {0, 40, 80, 120},
         .audio = {0, 46, 92, 138}},
        {.tags = {g_avc, g_aac, Nalu(0), Raw(0), Nalu(4000), Raw(4000), Nalu(4040), Nalu(0), Raw(4046), Raw(0),
                  Nalu(40)},
         .video = {0, 4000, 4040, 4080, 4120},
         .audio = {0, 4000, 4046, 4080}},
        {.tags = {g_avc, g_aac, Nalu(0), Raw(0), Nalu(4000), Nalu(4040), Nalu(0), Raw(0), Nalu(40)},
         .video = {0, 4000, 4040, 4080, 4120},
         .audio = {0, 4080}}, // the first part has less audio than video
    };
    for (const auto& [tags, video, audio, caps] : cases) {
        const TemporaryFile file(File(tags, audio.empty() ? 1 : 5).bytes);
        Pipeline pipeline(
            demuxed(file.path(), "appsink sync=false name=v", audio.empty() ? "" : "appsink sync=false name=a"));
        EXPECT_EQ(pipeline.play(), "");
        for (const auto& [sink, times] : {std::pair("v", video), std::pair("a", audio)}) {
            std::vector<uint64_t> arrived;
            for (const Arrival& arrival : pipeline.arrivals(sink)) {
                arrived.push_back(arrival.dts / GST_MSECOND);
                EXPECT_TRUE(*sink == 'a' || arrival.caps.find(caps) != std::string::npos) << arrival.caps;
            }
            EXPECT_EQ(arrived, times) << sink;
        }
    }
}

// There is one warning about frames that are not played; the rest is played.
TEST(Playing, WarnsOfWhatIsNotPlayed)
{
    const Tag h263 = {9, 80, VideoData(1, CODEC_H263, H263Picture(3))};
    const Tag pcm_stereo = {8, 40, AudioData(SOUND_PCM | 1, Noise(60))};
    const struct {
        Tags tags;
        const char* text;
    } cases[] = {
        {{g_avc, Nalu(0), g_aac, Raw(0), h263, h263, Raw(80)}, "from H.264 (AVC) to Sorenson H.263"},
        {{Pcm(0), Pcm(20), pcm_stereo, pcm_stereo}, "its sample rate, sample size or channels change"},
        {{g_aac, Nalu(0), Raw(0), Nalu(40), Raw(23)}, "no usable AVC configuration"},
        {{g_aac, Raw(0), {8, 23, AacConfig({0xFF})}, Raw(23)}, "is damaged and not used"},
        {{g_avc, Nalu(0), Raw(0), Nalu(40)}, "the audio cannot be decoded"},
    };
    for (const auto& [tags, text] : cases) {
        const TemporaryFile file(File(tags).bytes);
        Pipeline pipeline("filesrc location=" + file.path() + " ! flvdmxdemux ! fakesink");
        const std::string warning = pipeline.play(GST_MESSAGE_WARNING);
        EXPECT_NE(warning.find(text), std::string::npos) << warning;
        EXPECT_EQ(pipeline.play(), "") << text;
    }
}

TEST(Playing, FindsAConfigurationAfterTheFirstFrames)
{
    const TemporaryFile file(File({g_avc, Nalu(0), Raw(0), Raw(23), Nalu(40), g_aac, Raw(46), Raw(69)}).bytes);
    Pipeline pipeline(demuxed(file.path(), "fakesink", "appsink sync=false name=a"));
    EXPECT_EQ(pipeline.play(), "");
    ASSERT_EQ(pipeline.arrivals("a").size(), 4u);
    EXPECT_NE(pipeline.arrivals("a")[0].caps.find("codec_data=(buffer)121056e500"), std::string::npos);
}

// A source that delivers nothing blocks only its own pipeline, which can still be stopped.
TEST(Playing, IsNotBlockedByAnotherSource)
{
    Pipeline blocked("appsrc stream-type=random-access format=bytes size=100000 ! flvdmxdemux ! fakesink");
    gst_element_set_state(blocked.element(), GST_STATE_PLAYING);
    g_usleep(G_USEC_PER_SEC / 10);
    Pipeline other(demuxed(g_data + "avc_aac.flv", "fakesink", "fakesink"));
    EXPECT_EQ(other.play(), "");
}

// A sink does not wait for audio that ended long before, even if the queues hold less than the rest of the video.
TEST(Playing, FillsGaps)
{
    Tags tags = {g_avc, g_aac, Raw(0), Raw(23)};
    for (uint32_t i = 0; i < 250; ++i)
        tags.push_back({9, i * 40, AvcNalu(i % 100 == 0, Noise(60))});
    const TemporaryFile file(File(tags).bytes);
    const std::string branch = " ! queue max-size-buffers=5 ! appsink sync=false ";
    Pipeline pipeline("filesrc location=" + file.path() + " ! flvdmxdemux name=d d.video" + branch + "d.audio" +
                      branch);
    ASSERT_TRUE(pipeline.go_to(GST_STATE_PAUSED));
    for (const int flags : {GST_SEEK_FLAG_KEY_UNIT, GST_SEEK_FLAG_ACCURATE}) {
        ASSERT_TRUE(pipeline.seek(5000, GST_SEEK_FLAG_FLUSH | flags));
        EXPECT_TRUE(pipeline.go_to(GST_STATE_PAUSED));
    }
    EXPECT_EQ(pipeline.play(), "");
}

using Element = std::unique_ptr<GstElement, void (*)(gpointer)>;

Element named(GstElement* bin, const char* name)
{
    return {gst_bin_get_by_name(GST_BIN(bin), name), gst_object_unref};
}

// An element that is stopped and given another file plays only that one.
TEST(Playing, ForgetsThePreviousFile)
{
    Pipeline pipeline("filesrc name=f ! flvdmxdemux name=d  appsink name=video sync=false async=false  "
                      "appsink name=audio sync=false async=false");
    const auto link = +[](GstElement* demuxer, GstPad* pad, gpointer bin) {
        const Element sink = named(static_cast<GstElement*>(bin), GST_PAD_NAME(pad));
        gst_element_link_pads(demuxer, GST_PAD_NAME(pad), sink.get(), "sink");
    };
    g_signal_connect(named(pipeline.element(), "d").get(), "pad-added", G_CALLBACK(link), pipeline.element());
    const std::tuple<const char*, size_t, size_t> files[] = {
        {"avc_aac", 63, 109}, {"h263_mp3", 30, 79}, {"avc_bframes_aac", 50, 95}};
    for (const auto& [name, pictures, sounds] : files) {
        pipeline.forget_arrivals();
        g_object_set(named(pipeline.element(), "f").get(), "location", (g_data + name + ".flv").c_str(), nullptr);
        EXPECT_EQ(pipeline.play(), "") << name;
        EXPECT_EQ(std::pair(pipeline.arrivals("video").size(), pipeline.arrivals("audio").size()),
                  std::pair(pictures, sounds))
            << name;
        gst_element_set_state(pipeline.element(), GST_STATE_READY);
    }
}

TEST(Playing, ReportsTags)
{
    const Tag meta = {18, 0, OnMetaData("title: 'Film creator: 'Somebody comment: %2.0.2.255.254 videodatarate: 500")};
    const TemporaryFile file(File({meta, g_avc, Nalu(0), Nalu(40)}, 1).bytes);
    Pipeline pipeline(demuxed(file.path(), "appsink sync=false", ""));
    GstTagList* tags = gst_tag_list_new_empty();
    for (int i = 0; i < 2; ++i) { // of the file, of the stream
        GstMessage* const message = pipeline.play_until(GST_MESSAGE_TAG);
        ASSERT_TRUE(message != nullptr && GST_MESSAGE_TYPE(message) == GST_MESSAGE_TAG);
        GstTagList* more = nullptr;
        gst_message_parse_tag(message, &more);
        gst_tag_list_insert(tags, more, GST_TAG_MERGE_APPEND);
        gst_tag_list_unref(more);
        gst_message_unref(message);
    }
    gchar* const text = gst_tag_list_to_string(tags);
    const std::string told = text;
    g_free(text);
    gst_tag_list_unref(tags);
    for (const char* wanted : {"title=(string)Film", "artist=(string)Somebody", "bitrate=(uint)500000", "H.264"})
        EXPECT_NE(told.find(wanted), std::string::npos) << told;
    EXPECT_EQ(told.find("comment"), std::string::npos) << told; // it is not valid UTF-8
}

// A file that cannot be played fails soon, with a message that helps.
TEST(Playing, FailsWithAReason)
{
    const TemporaryFile empty(File({{18, 0, OnMetaData("width: 320")}}).bytes), configs(File({g_avc, g_aac}).bytes);
    const TemporaryFile unknown(
        File({{9, 0, VideoData(1, 9, Noise(100))}, {9, 40, VideoData(1, 9, Noise(100))}}).bytes);
    const struct {
        std::string description;
        const char* text;
    } cases[] = {
        {"filesrc location=" + empty.path() + " ! flvdmxdemux ! fakesink", "FLVD_ERR_NO_STREAM"},
        {"filesrc location=" + configs.path() + " ! flvdmxdemux ! fakesink", "has no frames"},
        {"appsrc stream-type=random-access format=bytes ! flvdmxdemux ! fakesink", "size of the file"},
        {"filesrc location=" + g_data + "script_data.txt ! flvdmxdemux ! fakesink", "FLVD_ERR_FILE_HEADER"},
        {"filesrc location=" + unknown.path() + " ! flvdmxdemux ! fakesink", "no stream has a known codec"},
        {"filesrc location=" + g_data + "avc_aac.flv ! queue ! flvdmxdemux ! fakesink", "supports pull mode"},
    };
    for (const auto& [description, text] : cases) {
        Pipeline pipeline(description);
        const std::string error = pipeline.play();
        EXPECT_NE(error, "") << description;
        EXPECT_NE(error.find(text), std::string::npos) << error;
    }
}

} // namespace

} // namespace flvd_test
