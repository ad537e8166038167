// The sample files: complete, growing, cut short, and damaged. The library must deliver what an independent prober
// found in them, and release all memory and files, which the fake host checks.

#include "support/expected.h"
#include "support/report.h"
#include "support/session.h"
#include "support/sweep.h"

#include <algorithm>
#include <array>
#include <map>
#include <optional>

using namespace flvd_test;

namespace {

const std::vector<Expected>& Samples()
{
    static std::vector<Expected> samples;
    for (size_t i = samples.size(); i < std::size(g_samples); ++i)
        samples.push_back(ReadExpected(g_samples[i]));
    return samples;
}

// The frames whose tags are complete within the first `size` bytes. Samples start at 0 ms, so frames have the times of
// their tags.
Frames Whole(const Expected& sample, uint32_t streams, int64_t size = INT64_MAX)
{
    Flv shown;
    for (const Tag& tag : sample.tags)
        if (tag.end() <= size)
            shown.tags.push_back(tag);
    return shown.frames(streams, 0);
}

// Opens and plays to the end, within a bound. `exact`: it opens as soon as the host shows a complete frame, and exactly
// the complete frames are delivered. One host serves all versions of a sample.
bool Play(FakeHost& host, const OpenOptions& open, const Expected& sample, bool exact)
{
    const int64_t size = host.visible();
    bool opened = false;
    host.reset_calls();
    {
        Session session(host, open);
        const bool growing = (open.options & GROWING) != 0, waits = growing && size < sample.size();
        opened = session.opened();
        EXPECT_TRUE(opened || !exact || waits || sample.tags.front().end() > size);
        EXPECT_TRUE(opened || session.failed_as_listed(Op::Open, session.open_rc())) << session.error_line();
        for (const uint32_t stream : opened ? Streams(open.options) : std::vector<uint32_t>{}) {
            const auto told = [ctx = session.ctx()] {
                return std::array{ctx->last_frame_size, ctx->last_video_ts, ctx->last_audio_ts};
            };
            Frames frames;
            auto last = told();
            FrameResult result = session.frame(stream);
            for (; result.rc == 0 && frames.size() <= static_cast<size_t>(size) / 15; result = session.frame(stream)) {
                last.at(0) = static_cast<uint32_t>(result.frame.data.size());
                last.at(result.frame.stream) = result.frame.timestamp;
                EXPECT_EQ(told(), last);
                frames.push_back(std::move(result.frame));
            }
            // A growing file may end with a complete frame that has not been delivered yet.
            EXPECT_TRUE(waits || (growing && !exact) || told() == last);
            EXPECT_TRUE(!exact || frames == Whole(sample, open.for_info ? 0 : stream, size))
                << testing::PrintToString(frames);
            EXPECT_TRUE(session.failed_as_listed(Op::Frame, result.rc)) << session.error_line();
        }
        EXPECT_LE(host.io_calls(), 16 * static_cast<uint64_t>(size) + 10000);
    }
    EXPECT_EQ(host.live_blocks(), 0u);
    EXPECT_EQ(host.calls(HostFn::Open), host.calls(HostFn::Close));
    return opened;
}

TEST(Samples, DeliverWhatTheProberFound)
{
    for (const uint32_t options : {0u, SEPARATE, USER, INDEX, GROWING, GROWING | SEPARATE})
        for (const uint32_t cache : {0u, 1024u, 1031u, 1u << 20})
            for (const Expected& sample : Samples())
                for (const bool only_32 : {false, true}) {
                    SCOPED_TRACE(sample.name + " with " + std::to_string(options) + ", " + std::to_string(cache));
                    FakeHost host(sample.bytes);
                    if (only_32)
                        host.use_32_bit_only();
                    const bool exact = sample.name != "damaged" || (options & GROWING) == 0;
                    EXPECT_TRUE(Play(host, {options, false, cache}, sample, exact));
                }
}

// The file grows by one byte at a time: first until it can be opened, with two readers until both streams are visible,
// and then between requests. Each frame is delivered by the first request after its last byte.
void PlayGrowing(const Expected& sample, uint32_t options)
{
    FakeHost host(sample.bytes);
    host.set_visible(0);
    const size_t streams = (options & SEPARATE) != 0 ? sample.streams.size() : 1;
    std::optional<Session> session;
    do
        session.emplace(host, OpenOptions{options});
    while ((!session->opened() || session->info().has_video + session->info().has_audio < streams) && host.grow(1));
    std::map<uint32_t, Frames> delivered;
    std::map<uint32_t, std::vector<int64_t>> ends; // of the tags
    for (const uint32_t stream : Streams(options))
        for (const Tag& tag : sample.tags)
            if ((tag.stream() & stream) != 0)
                ends[stream].push_back(tag.end());
    do
        for (const uint32_t stream : Streams(options)) {
            const auto& due = ends[stream];
            const size_t next = delivered[stream].size();
            FrameResult result = session->frame(stream);
            EXPECT_EQ(result.rc == 0, next < due.size() && due[next] <= host.visible()) << sample.name;
            if (result.rc == 0)
                delivered[stream].push_back(std::move(result.frame));
        }
    while (host.grow(1));
    for (const uint32_t stream : Streams(options))
        EXPECT_EQ(delivered[stream], Whole(sample, stream)) << sample.name;
}

TEST(Samples, GrowByOneByteBetweenRequests)
{
    for (const Expected& sample : Samples())
        for (const uint32_t options : {GROWING, GROWING | SEPARATE})
            if (sample.name != "damaged") // damage looks like data not written yet
                PlayGrowing(sample, options);
}

// Used in turn. The last one is the slowest, as the library's own frame buffer is large.
const OpenOptions g_variants[] = {
    {USER},    {USER | GROWING | SEPARATE}, {USER | SEPARATE | INDEX, false, 1024}, {USER | GROWING}, {USER, true},
    {SEPARATE}};
constexpr size_t VARIANTS = std::size(g_variants);

// More than ten thousand opens and closes on one host, without a leak.
TEST(Samples, CutAtEveryByteDeliverTheCompleteTags)
{
    Sweep sweep;
    for (const Expected& sample : Samples()) {
        FakeHost host(sample.bytes);
        for (int64_t cut = 0; cut < sample.size(); ++cut) {
            if (!sweep.takes_next())
                continue;
            SCOPED_TRACE(sample.name + " cut at " + std::to_string(cut));
            host.set_visible(cut);
            Play(host, g_variants[static_cast<size_t>(cut) % (VARIANTS - 1)], sample, sample.name != "damaged");
        }
    }
}

TEST(Samples, SurviveEveryChangedByte)
{
    Sweep sweep;
    for (const Expected& sample : Samples()) {
        FakeHost host;
        for (size_t at = 0; at < std::min<size_t>(sample.bytes.size(), 2000); ++at)
            for (const size_t value : {size_t{0}, size_t{0xFF}, at * 167 % 256}) { // a third value that varies
                if (!sweep.takes_next())
                    continue;
                SCOPED_TRACE(sample.name + " with " + std::to_string(value) + " at " + std::to_string(at));
                Bytes changed = sample.bytes;
                changed[at] = static_cast<uint8_t>(value);
                host.add_file(FakeHost::DEFAULT_FILE, std::move(changed));
                Play(host, g_variants[(at + value) % VARIANTS], sample, false);
            }
    }
}

} // namespace
