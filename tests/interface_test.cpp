// The C++ interface: what it adds to the C interface, on samples with known contents and on files in memory.

#include "flvdmx/flvdmx.hpp"
#include "flvdmx/memory_host.h"
#include "support/expected.h"

#include <algorithm>
#include <gtest/gtest.h>

using namespace flvd_test;
using namespace std::chrono_literals;
using flvdmx::Kind, flvdmx::SeekMode, flvdmx::Stream;

namespace {

const std::string g_data = FLVDMX_TEST_DATA "/";

struct Memory : flvd_memory_file_t {
    Memory(const char* path, const Bytes& bytes) : flvd_memory_file_t{path, bytes.data(), bytes.size(), nullptr}
    {
        flvd_memory_host_add(this);
    }
    ~Memory() { flvd_memory_host_remove(this); }
};

flvd_test::Frame Copy(const flvdmx::Frame& frame)
{
    return {static_cast<uint32_t>(frame.stream), static_cast<uint32_t>(frame.time.count()),
            Bytes(frame.data.begin(), frame.data.end())};
}

// A range-for over the frames of a file that is gone by then does not compile.
template <typename R, typename = void> constexpr bool g_has_frames = false;
template <typename R> constexpr bool g_has_frames<R, std::void_t<decltype(std::declval<R>()->frames())>> = true;
static_assert(g_has_frames<flvdmx::result<flvdmx::File>&> && !g_has_frames<flvdmx::result<flvdmx::File>>);

class Sample : public testing::TestWithParam<std::string> {};
// All frames and what is known of the file, against what another demuxer found; one reader, and two with an own buffer.
TEST_P(Sample, IsDescribedAndPlayed)
{
    const Expected expected = ReadExpected(GetParam());
    Bytes buffer(1u << 16);
    const flvdmx::Options apart = {0, 2000, true, false, true, false, buffer.data(), 1u << 16};
    for (const Stream asked : {Stream::any, Stream::video, Stream::audio}) {
        auto file = flvdmx::File::open(g_data + GetParam() + ".flv", asked == Stream::any ? flvdmx::Options() : apart);
        ASSERT_TRUE(file) << file.error().text();
        const flvdmx::Info info = file->info();
        EXPECT_EQ(info.size, expected.size());
        for (const ExpectedStream& stream : expected.streams) {
            const bool video = stream.stream == FLVD_STREAM_VIDEO;
            EXPECT_EQ(video ? info.video->config : info.audio->config, stream.extradata);
            EXPECT_EQ(video ? info.video->width : info.audio->sample_rate, video ? stream.width : stream.sample_rate);
        }
        flvd_test::Frames frames;
        flvdmx::File moved(std::move(*file));
        for (const flvdmx::Frame& frame : moved.frames(asked))
            frames.push_back(Copy(frame));
        EXPECT_EQ(frames, expected.frames(asked == Stream::any ? 3 : static_cast<uint32_t>(asked), 0));
        EXPECT_EQ(moved.last_error().kind(), Kind::end);
        EXPECT_STREQ(file->next_frame().error().name(), "FLVD_ERR_NO_INSTANCE");
    }
}
INSTANTIATE_TEST_SUITE_P(Interface, Sample, testing::Values("avc_aac", "h263_mp3"));

// Keyframes every 0.4 s: the index counts from 0, the tags from 23 ms.
TEST(Interface, SeeksAsNamed)
{
    // Where from, time, mode, the time reached or -1 for a miss.
    const std::tuple<std::chrono::milliseconds, std::chrono::milliseconds, SeekMode, int64_t> cases[] = {
        {0ms, 1000ms, SeekMode::automatic, 1223},
        {2000ms, 1000ms, SeekMode::absolute, 823},
        {0ms, 1000ms, SeekMode::backward, 823},
        {2400ms, -500ms, SeekMode::relative, 1623},
        {2400ms, -500ms, SeekMode::relative | SeekMode::forward, 2023},
        {0ms, 2900ms, SeekMode::forward, -1},
        {0ms, 2900ms, SeekMode::forward | SeekMode::retry_backward, 2823},
        {0ms, std::chrono::hours(10000), SeekMode::to_end_on_miss, -1}};
    for (const auto& [from, time, mode, wanted] : cases) {
        SCOPED_TRACE(testing::Message() << time.count() << " mode " << static_cast<uint32_t>(mode));
        auto file = flvdmx::File::open(g_data + "avc_aac_index.flv");
        ASSERT_TRUE(file->seek(from, SeekMode::forward));
        const auto reached = file->seek(time, mode);
        EXPECT_EQ(reached ? reached->count() : -1, wanted);
        EXPECT_EQ(reached.error().kind(), wanted < 0 ? Kind::miss : Kind::none);
        const auto next = file->next_frame();
        EXPECT_EQ(next.error().kind(), mode == SeekMode::to_end_on_miss ? Kind::end : Kind::none);
        EXPECT_TRUE(wanted < 0 || next->time.count() == wanted);
    }
}

// A file that arrives 100 bytes at a time, played beside another one: no frame is lost or doubled.
TEST(Interface, FollowsAGrowingFile)
{
    const Expected sample = ReadExpected("avc_aac"), another = ReadExpected("mp3_only");
    Memory growing("growing", sample.bytes), other("other", another.bytes);
    const flvdmx::Host memory = flvdmx::make_host(flvd_memory_host_fill);
    const flvdmx::Options options = {8192, 0, false, true};
    for (growing.size = 0; growing.size <= 258; ++growing.size) { // there begins the first media tag
        EXPECT_EQ(flvdmx::File::open("growing", memory, options).error().kind(), Kind::not_yet) << growing.size;
        EXPECT_EQ(flvdmx::File::open("growing", memory, {}).error().kind(), Kind::failed) << growing.size;
    }
    growing.size = 2500;
    const std::lock_guard lock(flvdmx::open_mutex); // opens and closes all the same
    auto file = flvdmx::File::open("growing", memory, options);
    auto second = flvdmx::File::open("other", memory);
    ASSERT_TRUE(file && second);
    const auto wait = [&] {
        growing.size = std::min<uint64_t>(growing.size + 100, sample.bytes.size());
        return growing.size < sample.bytes.size();
    };
    flvd_test::Frames frames, others;
    for (auto frame = file->follow(wait); frame; frame = file->follow(wait)) {
        frames.push_back(Copy(*frame));
        if (const auto beside = second->next_frame())
            others.push_back(Copy(*beside));
    }
    EXPECT_EQ(frames, sample.frames());
    EXPECT_EQ(others, another.frames());
    EXPECT_EQ(file->last_error().kind(), Kind::not_yet);
}

// More tags without a frame than one request passes. With two readers video is at its end before audio begins.
TEST(Interface, CrossesTagsWithoutAFrame)
{
    std::vector<Tag> tags = {g_avc, g_aac, Nalu(0), Raw(10)};
    for (int i = 0; i < 300; ++i)
        tags.push_back(i % 2 == 0 ? g_avc : g_aac);
    tags.insert(tags.end(), {Nalu(40), Raw(50)});
    const Bytes bytes = File(tags).bytes;
    const Memory memory("memory", bytes);
    for (const auto& [apart, growing] : {std::pair(false, false), {false, true}, {true, false}, {true, true}}) {
        SCOPED_TRACE(testing::Message() << (apart ? "two readers" : "one reader") << (growing ? ", growing" : ""));
        const flvdmx::Options options = {0, 0, apart, growing};
        auto file = flvdmx::File::open("memory", flvdmx::make_host(flvd_memory_host_fill), options);
        std::vector<int64_t> times;
        for (const Stream stream : apart ? std::vector{Stream::video, Stream::audio} : std::vector{Stream::any})
            for (const flvdmx::Frame& frame : file->frames(stream))
                times.push_back(frame.time.count());
        EXPECT_EQ(times, (apart ? std::vector<int64_t>{0, 40, 10, 50} : std::vector<int64_t>{0, 10, 40, 50}));
        EXPECT_EQ(file->last_error().kind(), growing ? Kind::not_yet : Kind::end);
    }
}

} // namespace
