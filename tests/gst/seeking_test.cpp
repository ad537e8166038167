// Seeks, queries and events; seeks from other threads while pipelines play.

#include "pipeline.h"

#include "flvdmx/flvdmx.hpp"

#include <gtest/gtest.h>

#include <atomic>
#include <chrono>
#include <optional>
#include <random>
#include <thread>

namespace flvd_test {

namespace {

const std::string g_data = FLVDMX_TEST_DATA "/";
constexpr int FLUSH = GST_SEEK_FLAG_FLUSH, KEY_UNIT = GST_SEEK_FLAG_FLUSH | GST_SEEK_FLAG_KEY_UNIT;
constexpr int AFTER = KEY_UNIT | GST_SEEK_FLAG_SNAP_AFTER, BEFORE = KEY_UNIT | GST_SEEK_FLAG_SNAP_BEFORE,
              ACCURATE = GST_SEEK_FLAG_FLUSH | GST_SEEK_FLAG_ACCURATE;

std::string Path(const char* sample)
{
    return g_data + sample + ".flv";
}

struct SeekCase {
    int64_t target;
    int flags;
    std::optional<int64_t> position; // of the next tag, as the C++ header finds it; none: the end
    int64_t time = 0;                // when to decode it
};

// Goes to the keyframe before the target; if the flags require it, to the one after it or the nearest; after the last
// one, to that.
flvdmx::result<flvdmx::Milliseconds> Reach(flvdmx::File& file, const SeekCase& seek)
{
    const flvdmx::Milliseconds target(seek.target);
    const auto before = file.seek(target, flvdmx::SeekMode::backward);
    const auto after = (seek.flags & AFTER) == AFTER ? file.seek(target, flvdmx::SeekMode::forward) : before;
    const bool nearest = (seek.flags & BEFORE) == BEFORE;
    const bool goes_back = !after || (nearest && target - *before < *after - target);
    return goes_back ? file.seek(target, flvdmx::SeekMode::backward) : after;
}

// Runs before there are pipelines, as all open files share one host.
std::vector<SeekCase> MakeSeeks(const char* sample, int count)
{
    std::mt19937 random(7); // NOLINT(cert-msc51-cpp): the same seeks in every run
    auto file = flvdmx::File::open(Path(sample));
    const int64_t duration = file->info().duration.count();
    std::vector<SeekCase> seeks;
    for (int i = 0; i < count; ++i) {
        constexpr int flags[] = {KEY_UNIT, BEFORE, AFTER, AFTER | GST_SEEK_FLAG_SNAP_BEFORE, ACCURATE, FLUSH};
        SeekCase one = {std::uniform_int_distribution<int64_t>(0, duration)(random), flags[i % 6], {}};
        if (Reach(*file, one)) {
            auto frame = file->next_frame();
            while (frame && frame->stream != flvdmx::Stream::video)
                frame = file->next_frame();
            one.position = frame->position;
            one.time = frame->time.count();
        }
        seeks.push_back(one);
    }
    return seeks;
}

class Seek : public testing::TestWithParam<const char*> {};

TEST_P(Seek, LandsWhereTheHeaderDoes)
{
    const std::vector<SeekCase> seeks = MakeSeeks(GetParam(), 200);
    Pipeline pipeline(demuxed(Path(GetParam()), "appsink sync=false name=v", "fakesink async=false"));
    ASSERT_TRUE(pipeline.go_to(GST_STATE_PAUSED));
    for (const SeekCase& seek : seeks) {
        SCOPED_TRACE(std::to_string(seek.target) + " ms, flags " + std::to_string(seek.flags));
        pipeline.forget_arrivals();
        ASSERT_TRUE(pipeline.seek(seek.target, seek.flags));
        ASSERT_TRUE(pipeline.go_to(GST_STATE_PAUSED));
        const std::vector<Arrival> video = pipeline.arrivals("v");
        ASSERT_EQ(!video.empty(), seek.position.has_value());
        if (video.empty())
            continue;
        EXPECT_EQ(video[0].offset, static_cast<uint64_t>(*seek.position));
        EXPECT_EQ(video[0].dts, static_cast<GstClockTime>(seek.time) * GST_MSECOND);
        EXPECT_TRUE(video[0].discont);
        EXPECT_FALSE(video[0].delta);
        const bool moves = (seek.flags & GST_SEEK_FLAG_KEY_UNIT) != 0;
        EXPECT_EQ(video[0].segment_start, static_cast<GstClockTime>(moves ? seek.time : seek.target) * GST_MSECOND);
    }
}

INSTANTIATE_TEST_SUITE_P(Gst, Seek, testing::Values("avc_aac", "avc_aac_index", "avc_bframes_aac", "h263_mp3"),
                         [](const testing::TestParamInfo<const char*>& i) { return std::string(i.param); });

// A segment ends where the seek set its end, with a message if requested, and playing continues from there.
TEST(Seeking, EndsSegments)
{
    Pipeline pipeline(demuxed(Path("avc_aac_index"), "appsink sync=false name=v", "appsink sync=false name=a"));
    ASSERT_TRUE(pipeline.go_to(GST_STATE_PAUSED));
    pipeline.forget_arrivals();
    ASSERT_TRUE(pipeline.seek(1000, ACCURATE | GST_SEEK_FLAG_SEGMENT, 2000));
    GstMessage* message = pipeline.play_until(GST_MESSAGE_SEGMENT_DONE | GST_MESSAGE_EOS);
    ASSERT_NE(message, nullptr);
    gint64 end = 0;
    ASSERT_EQ(GST_MESSAGE_TYPE(message), GST_MESSAGE_SEGMENT_DONE);
    gst_message_parse_segment_done(message, nullptr, &end);
    gst_message_unref(message);
    EXPECT_EQ(end, 2 * static_cast<gint64>(GST_SECOND));
    for (const char* sink : {"v", "a"}) { // buffers may arrive after the message
        for (int i = 0; i < 500 && pipeline.last_time(sink) <= 1900 * GST_MSECOND; ++i)
            std::this_thread::sleep_for(std::chrono::milliseconds(10));
        ASSERT_GT(pipeline.arrivals(sink).size(), 25u);
        EXPECT_LT(pipeline.last_time(sink), 2 * GST_SECOND);
    }
    ASSERT_TRUE(pipeline.seek(2000, GST_SEEK_FLAG_NONE)); // without a flush
    EXPECT_EQ(pipeline.play(), "");
    EXPECT_GT(pipeline.last_time("v"), 2900 * GST_MSECOND);
    EXPECT_EQ(pipeline.arrivals("v").back().segment_base, GST_SECOND); // continues where the other one ended
}

// The times in an index may count from the first frame although the timestamps do not. Without rising times, seeking is
// impossible.
TEST(Seeking, ReplacesAWrongIndex)
{
    const auto hook = [](std::vector<double>& times, std::vector<double>&) {
        std::for_each(times.begin(), times.end(), [](double& time) { time -= 100.0; });
    };
    const TemporaryFile file(MakeChain({.index = true, .pictures = 100, .first_ts = 100'000, .hook = hook}).bytes);
    for (const int flags : {ACCURATE, KEY_UNIT, AFTER}) {
        Pipeline pipeline(demuxed(file.path(), "appsink sync=false name=v", "fakesink async=false"));
        ASSERT_TRUE(pipeline.go_to(GST_STATE_PAUSED));
        pipeline.forget_arrivals();
        ASSERT_TRUE(pipeline.seek(2100, flags) && pipeline.go_to(GST_STATE_PAUSED));
        EXPECT_EQ(pipeline.last_time("v"), (flags == AFTER ? 2200 : 2000) * GST_MSECOND);
    }
    const TemporaryFile wrapped(File({g_avc, Nalu(0xFFFFFFB0), Nalu(0)}, 1).bytes);
    Pipeline pipeline(demuxed(wrapped.path(), "appsink sync=false", ""));
    ASSERT_TRUE(pipeline.go_to(GST_STATE_PAUSED));
    GstQuery* const query = gst_query_new_seeking(GST_FORMAT_TIME);
    gboolean seekable = TRUE;
    EXPECT_TRUE(gst_element_query(pipeline.element(), query));
    gst_query_parse_seeking(query, nullptr, &seekable, nullptr, nullptr);
    EXPECT_FALSE(seekable || pipeline.seek(0, FLUSH));
    gst_query_unref(query);
}

// A seek by a handler of the new pads runs within the streaming thread. Playing begins at its target.
TEST(Seeking, WorksWhilePadsAreAdded)
{
    for (const char* signal : {"pad-added", "no-more-pads"}) {
        Pipeline pipeline("filesrc location=" + Path("avc_aac") +
                          " ! flvdmxdemux name=d d.audio ! appsink sync=false name=a");
        GstElement* const demuxer = gst_bin_get_by_name(GST_BIN(pipeline.element()), "d");
        const auto seek = [](GstElement* element) {
            GstPad* const pad = gst_element_get_static_pad(element, "video");
            const auto flags = static_cast<GstSeekFlags>(KEY_UNIT);
            gst_pad_send_event(pad, gst_event_new_seek(1.0, GST_FORMAT_TIME, flags, GST_SEEK_TYPE_SET, GST_SECOND,
                                                       GST_SEEK_TYPE_NONE, -1));
            gst_object_unref(pad);
        };
        g_signal_connect(demuxer, signal, G_CALLBACK(+seek), nullptr);
        gst_object_unref(demuxer);
        EXPECT_EQ(pipeline.play(), "");
        const std::vector<Arrival> audio = pipeline.arrivals("a");
        ASSERT_FALSE(audio.empty()) << signal;
        EXPECT_GT(audio[0].segment_start, 0u) << signal;
        EXPECT_GT(audio[0].dts + 100 * GST_MSECOND, audio[0].segment_start) << signal;
    }
}

// Where a long hole keeps the library from finding the target, playing begins before the hole.
TEST(Seeking, ReachesEveryTimeDespiteAHole)
{
    Bytes bytes = MakeChain({.index = false, .pictures = 100}).bytes;
    bytes.insert(bytes.begin() + static_cast<std::ptrdiff_t>(bytes.size() / 2), 3 << 20, 0);
    const TemporaryFile file(bytes);
    Pipeline pipeline(demuxed(file.path(), "appsink sync=false name=v", "fakesink async=false"));
    ASSERT_TRUE(pipeline.go_to(GST_STATE_PAUSED));
    for (const int flags : {FLUSH, KEY_UNIT, AFTER, ACCURATE})
        for (int64_t target = 0; target < 4000; target += 500)
            EXPECT_TRUE(pipeline.seek(target, flags)) << target << ", flags " << flags;
    pipeline.forget_arrivals();
    EXPECT_EQ(pipeline.play(), "");
    EXPECT_LE(pipeline.arrivals("v").front().dts, 3500 * GST_MSECOND);
    EXPECT_EQ(pipeline.last_time("v"), 3960 * GST_MSECOND);
}

// A flush sets the running time to 0. If the seek then fails, playing must not wait until the old time has passed
// again.
TEST(Seeking, ContinuesAtOnceAfterAFailedSeek)
{
    static std::atomic<bool> s_fails = false;
    const auto fail = [](GstPad*, GstPadProbeInfo* info, gpointer) {
        GST_PAD_PROBE_INFO_FLOW_RETURN(info) = GST_FLOW_ERROR;
        return s_fails ? GST_PAD_PROBE_HANDLED : GST_PAD_PROBE_OK;
    };
    const auto watch = [](GstPad*, GstPadProbeInfo* info, gpointer) { // only the seek reads between these two events
        const GstEventType type = GST_EVENT_TYPE(GST_PAD_PROBE_INFO_EVENT(info));
        s_fails = (type == GST_EVENT_FLUSH_STOP || s_fails) && type != GST_EVENT_SEGMENT;
        return GST_PAD_PROBE_OK;
    };
    Tags tags = {g_avc};
    for (uint32_t i = 0; i < 100; ++i)
        tags.push_back(Nalu(i * 10, 32768));
    const TemporaryFile file(File(tags, 1).bytes);
    Pipeline pipeline("filesrc location=" + file.path() + " ! flvdmxdemux name=d ! appsink name=v");
    ASSERT_TRUE(pipeline.go_to(GST_STATE_PAUSED));
    GstElement* const demuxer = gst_bin_get_by_name(GST_BIN(pipeline.element()), "d");
    GstPad *const sink = gst_element_get_static_pad(demuxer, "sink"), *const source =
                                                                          gst_element_get_static_pad(demuxer, "video");
    constexpr int events = GST_PAD_PROBE_TYPE_EVENT_DOWNSTREAM | GST_PAD_PROBE_TYPE_EVENT_FLUSH;
    gst_pad_add_probe(sink, GST_PAD_PROBE_TYPE_PULL, fail, nullptr, nullptr);
    gst_pad_add_probe(source, static_cast<GstPadProbeType>(events), watch, nullptr, nullptr);
    for (gpointer object : {gpointer(demuxer), gpointer(sink), gpointer(source)})
        gst_object_unref(object);
    gst_element_set_state(pipeline.element(), GST_STATE_PLAYING);
    while (pipeline.last_time("v") < 500 * GST_MSECOND)
        std::this_thread::sleep_for(std::chrono::milliseconds(10));
    EXPECT_FALSE(pipeline.seek(100, FLUSH));
    EXPECT_EQ(pipeline.play(), "");
    const Arrival last = pipeline.arrivals("v").back();
    EXPECT_EQ(last.dts, 990 * GST_MSECOND);
    EXPECT_GE(last.segment_start, 500 * GST_MSECOND);
    EXPECT_EQ(last.segment_base, 0u);
}

// Either end of a segment may be relative to the end of the file or left as it is. A refused seek does not even flush.
TEST(Seeking, ResolvesBothEnds)
{
    constexpr auto none = GST_SEEK_TYPE_NONE, set = GST_SEEK_TYPE_SET, end = GST_SEEK_TYPE_END;
    constexpr int64_t refused = -2, open = -1;
    const struct { // ms, one seek after the other in a file of 2508 ms
        GstSeekType start_type;
        int64_t start;
        GstSeekType stop_type;
        int64_t stop;
        int64_t wanted_start, wanted_stop;
    } cases[] = {
        {set, 500, set, 1000, 500, 1000},  {set, 600, none, -1, 600, 1000},     {set, 1500, none, -1, 1500, open},
        {none, -1, set, 1000, refused, 0}, {end, -508, end, -8, 2000, 2500},    {end, -9000, set, -1, 0, open},
        {set, -7000, set, 900, 0, 900},    {set, 2000, end, -2000, refused, 0}, {set, 1000, set, 999, refused, 0},
        {set, 0, end, -9000, 0, 0},
    };
    Pipeline pipeline(demuxed(Path("avc_aac"), "appsink sync=false name=v", "fakesink async=false"));
    ASSERT_TRUE(pipeline.go_to(GST_STATE_PAUSED));
    for (const auto& [start_type, start, stop_type, stop, wanted_start, wanted_stop] : cases) {
        SCOPED_TRACE(std::to_string(start) + " to " + std::to_string(stop));
        const auto ns = [](int64_t time) { return time == -1 ? time : time * static_cast<int64_t>(GST_MSECOND); };
        pipeline.forget_arrivals();
        EXPECT_EQ(gst_element_seek(pipeline.element(), 1.0, GST_FORMAT_TIME, static_cast<GstSeekFlags>(ACCURATE),
                                   start_type, ns(start), stop_type, ns(stop)) != FALSE,
                  wanted_start != refused);
        EXPECT_TRUE(pipeline.go_to(GST_STATE_PAUSED));
        if (wanted_start == refused) {
            EXPECT_TRUE(pipeline.arrivals("v").empty());
            continue;
        }
        GstQuery* const query = gst_query_new_segment(GST_FORMAT_TIME);
        GstElement* const demuxer = gst_bin_get_by_name(GST_BIN(pipeline.element()), "d");
        EXPECT_TRUE(gst_element_query(demuxer, query));
        gint64 first = 0, last = 0;
        gst_query_parse_segment(query, nullptr, nullptr, &first, &last);
        EXPECT_EQ(first, ns(wanted_start));
        EXPECT_EQ(last, ns(wanted_stop == open ? 2508 : wanted_stop));
        gst_object_unref(demuxer);
        gst_query_unref(query);
    }
}

TEST(Seeking, RejectsUnsupportedSeeksAndEndsPastTheEnd)
{
    Pipeline pipeline(demuxed(Path("avc_aac"), "appsink sync=false name=v", "fakesink"));
    ASSERT_TRUE(pipeline.go_to(GST_STATE_PAUSED));
    EXPECT_FALSE(pipeline.seek(0, FLUSH, 1000, -1.0));
    EXPECT_FALSE(gst_element_seek_simple(pipeline.element(), GST_FORMAT_BYTES, GST_SEEK_FLAG_FLUSH, 13));
    EXPECT_TRUE(pipeline.seek(3'600'000, ACCURATE));
    EXPECT_EQ(pipeline.play(), "");
}

TEST(Seeking, AnswersQueries)
{
    Pipeline pipeline(demuxed(Path("avc_aac"), "appsink sync=false name=v", "fakesink async=false"));
    ASSERT_TRUE(pipeline.go_to(GST_STATE_PAUSED));
    gint64 value = 0;
    EXPECT_TRUE(gst_element_query_duration(pipeline.element(), GST_FORMAT_TIME, &value));
    EXPECT_EQ(value, 2508 * static_cast<gint64>(GST_MSECOND));
    ASSERT_TRUE(pipeline.seek(1500, KEY_UNIT) && pipeline.go_to(GST_STATE_PAUSED));
    EXPECT_TRUE(gst_element_query_position(pipeline.element(), GST_FORMAT_TIME, &value));
    EXPECT_EQ(value, 1023 * static_cast<gint64>(GST_MSECOND));
    ASSERT_TRUE(pipeline.seek(1500, ACCURATE) && pipeline.go_to(GST_STATE_PAUSED));
    EXPECT_TRUE(gst_element_query_position(pipeline.element(), GST_FORMAT_TIME, &value));
    EXPECT_EQ(value, 1500 * static_cast<gint64>(GST_MSECOND));
    GstQuery* const query = gst_query_new_seeking(GST_FORMAT_TIME);
    gboolean seekable = FALSE;
    EXPECT_TRUE(gst_element_query(pipeline.element(), query));
    gst_query_parse_seeking(query, nullptr, &seekable, nullptr, &value);
    EXPECT_TRUE(seekable);
    EXPECT_EQ(value, 2508 * static_cast<gint64>(GST_MSECOND));
    gst_query_unref(query);
}

// Seeks until the time is over.
void SeekAtRandom(Pipeline& pipeline, unsigned seed, std::chrono::steady_clock::time_point end)
{
    std::mt19937 random(seed);
    while (std::chrono::steady_clock::now() < end) {
        constexpr int flags[] = {KEY_UNIT, AFTER, ACCURATE, FLUSH};
        pipeline.seek(std::uniform_int_distribution<int64_t>(0, 2500)(random), flags[random() % 4]);
        std::this_thread::sleep_for(std::chrono::microseconds(random() % 2000));
    }
}

// Several pipelines play while two threads seek in each, and others are opened and stopped at the same time. All still
// reach their end.
TEST(Seeking, WorksFromManyThreads)
{
    const auto end = std::chrono::steady_clock::now() + std::chrono::seconds(2);
    std::vector<std::unique_ptr<Pipeline>> pipelines;
    std::vector<std::thread> threads;
    for (const char* sample : {"avc_aac", "avc_aac_index", "h263_mp3"}) {
        pipelines.push_back(std::make_unique<Pipeline>(
            demuxed(Path(sample), "fakesink sync=true", "fakesink sync=true"))); // in real time, so that they last
        Pipeline& pipeline = *pipelines.back();
        ASSERT_TRUE(pipeline.go_to(GST_STATE_PAUSED));
        gst_element_set_state(pipeline.element(), GST_STATE_PLAYING);
        for (unsigned i = 0; i < 2; ++i)
            threads.emplace_back([&pipeline, i, end] { SeekAtRandom(pipeline, i, end); });
    }
    int played = 0;
    for (; std::chrono::steady_clock::now() < end; ++played) {
        Pipeline other(demuxed(Path("avc_only"), "fakesink sync=false", ""));
        ASSERT_EQ(other.play(), "");
        Pipeline ended_early(demuxed(Path("damaged"), "fakesink sync=false", "fakesink sync=false"));
        gst_element_set_state(ended_early.element(), GST_STATE_PLAYING);
    }
    for (std::thread& thread : threads)
        thread.join();
    EXPECT_GT(played, 0);
    for (const auto& pipeline : pipelines) {
        EXPECT_TRUE(pipeline->seek(2000, KEY_UNIT));
        EXPECT_EQ(pipeline->play(), "");
    }
}

} // namespace

} // namespace flvd_test
