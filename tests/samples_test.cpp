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

// All samples begin at 0 ms, so times from the first timestamp are the tags' own.
struct Packet {
    Frame frame;
    int64_t end; // of its tag
};

struct Sample {
    std::string name;
    Bytes bytes;
    Expected expected;
    std::vector<Packet> packets;

    Frames frames(uint32_t streams) const
    {
        Frames out;
        for (const Packet& packet : packets)
            if ((packet.frame.stream & streams) != 0)
                out.push_back(packet.frame);
        return out;
    }
};

Sample Load(const std::string& name)
{
    Sample sample{name, ReadSample(name + ".flv"), ReadExpected(name), {}};
    for (const ExpectedPacket& packet : sample.expected.packets) {
        const uint8_t* const tag = sample.bytes.data() + packet.pos;
        const uint8_t* const end = tag + 11 + (tag[1] << 16 | tag[2] << 8 | tag[3]);
        const Frame frame{packet.stream, packet.timestamp, Bytes(end - packet.size, end)};
        EXPECT_TRUE(SameFrame(packet, frame)) << name << " at " << packet.pos;
        sample.packets.push_back({frame, end + 4 - sample.bytes.data()});
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

// Plays what was opened to its end, which has to come in time. `exact`: the frames whose tags lie whole in what the
// host shows have to come, and no others.
void PlayOut(const FakeHost& host, Session& session, const OpenOptions& open, const Sample& sample, bool exact)
{
    const int64_t size = host.visible();
    for (const uint32_t stream : Streams(open.options)) {
        auto next = sample.packets.begin();
        const auto wanted = [&next, &sample, stream, size] {
            while (next != sample.packets.end() && ((next->frame.stream & stream) == 0 || next->end > size))
                ++next;
            return next != sample.packets.end();
        };
        int64_t frames = 0;
        FrameResult result = session.frame(stream);
        for (; result.rc == 0 && frames <= size / 15; ++frames, result = session.frame(stream))
            ASSERT_TRUE(!exact || (wanted() && next++->frame == result.frame)) << "frame " << frames;
        ASSERT_TRUE(!exact || open.for_info || !wanted()) << "frame " << frames << " is missing";
        EXPECT_TRUE(session.failed_as_listed(Op::Frame, result.rc)) << session.error_line();
    }
    EXPECT_LE(host.io_calls(), 16 * static_cast<uint64_t>(size) + 10000);
}

void ExpectStreams(const flvd_open_info_t& info, const Expected& expected)
{
    const ExpectedStream* const video = expected.find(VIDEO);
    const ExpectedStream* const audio = expected.find(AUDIO);
    ASSERT_EQ(std::pair(info.has_video != 0, info.has_audio != 0), std::pair(video != nullptr, audio != nullptr));
    if (video != nullptr) {
        const flvd_video_info_t& found = *info.video_info;
        EXPECT_EQ(Bytes(found.config, found.config + found.config_size), video->extradata);
        EXPECT_EQ(std::pair(found.width, found.height), std::pair(video->width, video->height));
    }
    if (audio != nullptr) {
        const flvd_audio_info_t& found = *info.audio_info;
        EXPECT_EQ(Bytes(found.config, found.config + found.config_size), audio->extradata);
        EXPECT_EQ(found.channels, audio->channels);
        EXPECT_TRUE(audio->codec == "speex" || found.sample_rate == audio->sample_rate) << found.sample_rate;
    }
}

TEST(Samples, DeliverWhatTheProberFound)
{
    const OpenOptions modes[] = {{},
                                 {0, false, 1024},
                                 {0, false, 1031},
                                 {0, false, 1 << 20},
                                 {SEPARATE},
                                 {SEPARATE, false, 1024},
                                 WithBuffer(0),
                                 {INDEX},
                                 {GROWING},
                                 {GROWING | SEPARATE, false, 1024}};
    for (const Sample& sample : Samples()) {
        for (const OpenOptions& mode : modes) {
            for (const bool only_32 : {false, true}) {
                SCOPED_TRACE(sample.name + " with mode " + std::to_string(&mode - modes));
                FakeHost host(sample.bytes);
                if (only_32)
                    host.use_32_bit_only();
                Session session(host, mode);
                ASSERT_TRUE(session.opened());
                ExpectStreams(session.info(), sample.expected);
                PlayOut(host, session, mode, sample, sample.name != "damaged" || (mode.options & GROWING) == 0);
            }
        }
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
    std::map<uint32_t, Frames> delivered;
    for (bool more = true; more;) {
        more = host.grow(1);
        for (const uint32_t stream : Streams(options))
            if (FrameResult result = session->frame(stream); result.rc == 0) {
                more = true;
                delivered[stream].push_back(std::move(result.frame));
            }
    }
    for (const uint32_t stream : Streams(options))
        EXPECT_EQ(delivered[stream], sample.frames(stream)) << sample.name << " stream " << stream;
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

// One host serves all changes of a sample.
void OpenAndPlay(FakeHost& host, const OpenOptions& open, const Sample& sample, bool exact)
{
    host.reset_calls();
    {
        Session session(host, open);
        if (session.opened())
            PlayOut(host, session, open, sample, exact);
        else
            EXPECT_TRUE(session.failed_as_listed(Op::Open, session.open_rc())) << session.error_line();
        const bool must_open = exact && (open.options & GROWING) == 0;
        EXPECT_TRUE(session.opened() || !must_open || sample.packets.front().end > host.visible());
    }
    EXPECT_EQ(host.live_blocks(), 0u);
    EXPECT_EQ(host.calls(HostFn::Open), host.calls(HostFn::Close));
}

TEST(Samples, CutAtEveryByteDeliverTheWholeTags)
{
    for (const Sample& sample : Samples()) {
        FakeHost host(sample.bytes);
        for (int64_t cut = 0; cut < sample.expected.file_size; ++cut) {
            SCOPED_TRACE(sample.name + " cut at " + std::to_string(cut));
            host.set_visible(cut);
            OpenAndPlay(host, g_variants[static_cast<size_t>(cut) % (VARIANTS - 1)], sample, sample.name != "damaged");
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
                OpenAndPlay(host, g_variants[++variant % VARIANTS], sample, false);
            }
        }
    }
}

} // namespace
