// The sample files whole, growing, cut short, and damaged. What is delivered is what an
// independent prober found in them; whatever happens, all that was taken from the host is given back, which the fake
// host itself watches over.

#include "support/expected.h"
#include "support/report.h"
#include "support/session.h"

#include <algorithm>
#include <map>
#include <optional>

using namespace flvd_test;

namespace {

constexpr uint32_t USER_BYTES = 8192; // above every frame of the samples

OpenOptions WithBuffer(uint32_t options, bool for_info = false, uint32_t cache_size = 0)
{
    return {options | USER, for_info, cache_size, 0, FakeHost::DEFAULT_FILE, USER_BYTES};
}

struct Sample {
    std::string name;
    Bytes bytes;
    Expected expected;
    std::vector<std::pair<Frame, int64_t>> frames = {}; // each with the end of its tag
};

Sample Load(const std::string& name)
{
    Sample sample{name, ReadSample(name + ".flv"), ReadExpected(name)};
    for (const ExpectedPacket& packet : sample.expected.packets) { // from 0 ms on: the tags' times are the frames'
        const uint8_t* const tag = sample.bytes.data() + packet.pos;
        const uint8_t* const end = tag + 11 + (tag[1] << 16 | tag[2] << 8 | tag[3]);
        const Frame frame{packet.stream, packet.timestamp, Bytes(end - packet.size, end)};
        EXPECT_TRUE(SameFrame(packet, frame)) << name << " at " << packet.pos;
        sample.frames.emplace_back(frame, end + 4 - sample.bytes.data());
    }
    return sample;
}

const std::vector<Sample>& Samples()
{
    static const std::vector<Sample> samples = {Load("aac_only"),        Load("avc_aac"),   Load("avc_aac_index"),
                                                Load("avc_bframes_aac"), Load("avc_only"),  Load("h263_mp3"),
                                                Load("mp3_only"),        Load("pcm_only"),  Load("screen"),
                                                Load("speex_only"),      Load("truncated"), Load("damaged")};
    return samples;
}

// The streams to ask for, one after the other.
std::vector<uint32_t> Streams(uint32_t options)
{
    return (options & SEPARATE) != 0 ? std::vector{VIDEO, AUDIO} : std::vector{BOTH};
}

// Opens and plays to the end, which has to come in time. `exact`: it opens as soon as a frame lies whole in what the
// host shows, and the frames that do have to come, and no others. One host serves all changes of a sample.
bool Play(FakeHost& host, const OpenOptions& open, const Sample& sample, bool exact)
{
    const int64_t size = host.visible();
    bool opened = false;
    host.reset_calls();
    {
        Session session(host, open);
        const bool waits = (open.options & GROWING) != 0 && size < sample.expected.file_size;
        opened = session.opened();
        EXPECT_TRUE(opened || !exact || waits || sample.frames.front().second > size);
        EXPECT_TRUE(opened || session.failed_as_listed(Op::Open, session.open_rc())) << session.error_line();
        for (const uint32_t stream : opened ? Streams(open.options) : std::vector<uint32_t>{}) {
            Frames due;
            for (const auto& [frame, end] : sample.frames)
                if (!open.for_info && (frame.stream & stream) != 0 && end <= size)
                    due.push_back(frame);
            Frames frames;
            FrameResult result = session.frame(stream);
            for (; result.rc == 0 && frames.size() <= static_cast<size_t>(size) / 15; result = session.frame(stream))
                frames.push_back(std::move(result.frame));
            EXPECT_TRUE(!exact || frames == due) << testing::PrintToString(frames);
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
            for (const Sample& sample : Samples())
                for (const bool only_32 : {false, true}) {
                    SCOPED_TRACE(sample.name + " with " + std::to_string(options) + ", " + std::to_string(cache));
                    FakeHost host(sample.bytes);
                    if (only_32)
                        host.use_32_bit_only();
                    const bool exact = sample.name != "damaged" || (options & GROWING) == 0;
                    EXPECT_TRUE(Play(host, {options, false, cache}, sample, exact));
                }
}

// The file grows by one byte at a time: until it can be opened, with two readers until both streams can be seen, and
// then between requests.
void PlayGrowing(const Sample& sample, uint32_t options)
{
    FakeHost host(sample.bytes);
    host.set_visible(0);
    const size_t streams = (options & SEPARATE) != 0 ? sample.expected.streams.size() : 1;
    std::optional<Session> session;
    do
        session.emplace(host, OpenOptions{options});
    while ((!session->opened() || session->info().has_video + session->info().has_audio < streams) && host.grow(1));
    std::map<uint32_t, Frames> delivered, due;
    for (bool more = true; more;) {
        more = host.grow(1);
        for (const uint32_t stream : Streams(options))
            if (FrameResult result = session->frame(stream); result.rc == 0) {
                more = true;
                delivered[stream].push_back(std::move(result.frame));
            }
    }
    for (const auto& [frame, end] : sample.frames)
        due[(options & SEPARATE) != 0 ? frame.stream : BOTH].push_back(frame);
    EXPECT_EQ(delivered, due) << sample.name;
}

TEST(Samples, GrowByOneByteBetweenRequests)
{
    for (const Sample& sample : Samples())
        for (const uint32_t options : {GROWING, GROWING | SEPARATE})
            if (sample.name != "damaged") // nothing can tell damage from what has not been written yet
                PlayGrowing(sample, options);
}

// Taken in turn. The last one takes the longest: the library's own frame buffer is large.
const OpenOptions g_variants[] = {WithBuffer(0),
                                  WithBuffer(GROWING | SEPARATE),
                                  WithBuffer(SEPARATE | INDEX, false, 1024),
                                  WithBuffer(GROWING),
                                  WithBuffer(0, true),
                                  {SEPARATE}};
constexpr size_t VARIANTS = std::size(g_variants);

TEST(Samples, CutAtEveryByteDeliverTheWholeTags)
{
    for (const Sample& sample : Samples()) {
        FakeHost host(sample.bytes);
        for (int64_t cut = 0; cut < sample.expected.file_size; ++cut) {
            SCOPED_TRACE(sample.name + " cut at " + std::to_string(cut));
            host.set_visible(cut);
            Play(host, g_variants[static_cast<size_t>(cut) % (VARIANTS - 1)], sample, sample.name != "damaged");
        }
    }
}

TEST(Samples, SurviveEveryChangedByte)
{
    uint32_t random = 1;
    for (const Sample& sample : Samples()) {
        FakeHost host;
        for (size_t at = 0; at < std::min<size_t>(sample.bytes.size(), 2000); ++at) {
            random = random * 1664525u + 1013904223u;
            size_t variant = at;
            for (const uint8_t value : {uint8_t{0}, uint8_t{0xFF}, static_cast<uint8_t>(random >> 24)}) {
                SCOPED_TRACE(sample.name + " with " + std::to_string(value) + " at " + std::to_string(at));
                Bytes changed = sample.bytes;
                changed[at] = value;
                host.add_file(FakeHost::DEFAULT_FILE, std::move(changed));
                Play(host, g_variants[++variant % VARIANTS], sample, false);
            }
        }
    }
}

} // namespace
