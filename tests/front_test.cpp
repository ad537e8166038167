// Opening, probing and delivery as a host sees them, and every place where they can fail.

#include "support/report.h"
#include "support/session.h"

#include <algorithm>
#include <array>
#include <tuple>

using namespace flvd_test;

namespace {

constexpr uint32_t SEPARATE = FLVD_OPT_SEPARATE_AUDIO_READER;
constexpr uint32_t USER = FLVD_OPT_USER_BUFFER;
constexpr uint32_t GROWING = FLVD_OPT_PROGRESSIVE;
constexpr uint32_t INDEX = FLVD_OPT_INDEX_IN_MEMORY;
constexpr size_t BUDGET = 102;   // tags that a request or a probing handles
constexpr uint32_t SMALL = 1024; // a cache below LARGE tags, which then cost host calls of their own
constexpr size_t LARGE = 3000;   // bytes
constexpr size_t GROWN = 600000; // bytes, above the first frame buffer
constexpr uint32_t MIB = 0x100000;
constexpr uint8_t SOUND_MP3_8K = 0xEF;
constexpr uint8_t SOUND_AAC = 0xAF;

const auto Video = [](uint32_t ts, const Bytes& data) { return Tag{9, ts, data}; };
const auto Audio = [](uint32_t ts, const Bytes& data) { return Tag{8, ts, data}; };
const auto Screen = [](uint32_t ts, size_t size = 60) { return Video(ts, VideoData(1, CODEC_SCREEN, Noise(size))); };
const auto Nalu = [](uint32_t ts, size_t size = 60) { return Video(ts, AvcNalu(true, Noise(size))); };
const auto Pcm = [](uint32_t ts, size_t size = 60) { return Audio(ts, AudioData(SOUND_PCM, Noise(size))); };
const auto Raw = [](uint32_t ts, size_t size = 60) { return Audio(ts, AacRaw(Noise(size))); };
const Tag g_meta = {18, 0, amf::OnMetaData({{"width", amf::Number(320)}})};
const Tag g_avc = Video(0, AvcConfig(SmallAvcRecord()));
const Tag g_aac = Audio(0, AacConfig({0x12, 0x10, 0x56, 0xE5, 0x00})); // its back-pointer passes for a script tag

Flv File(const std::vector<Tag>& tags, uint8_t flags = 5, const Bytes& prefix = {}, uint32_t header = 9)
{
    FlvBuilder builder(flags, static_cast<uint32_t>(prefix.size()) + header);
    builder.prefix(prefix);
    for (const Tag& tag : tags)
        builder.add(tag);
    return builder.build();
}

Flv Repeat(size_t n, const Tag& tag, std::vector<Tag> behind, uint8_t flags = 5)
{
    behind.insert(behind.begin(), n, tag);
    return File(behind, flags);
}

// The first bytes; negative: all but the last bytes.
Bytes Cut(const Bytes& bytes, int64_t size)
{
    return Bytes(bytes.begin(), (size < 0 ? bytes.end() : bytes.begin()) + static_cast<std::ptrdiff_t>(size));
}

Flv Indexed(uint32_t gop)
{
    ChainOptions options;
    options.index = true;
    options.gop = gop;
    return MakeChain(options);
}

const Flv g_chain = MakeChain();
const Flv g_indexed = Indexed(5);

// The indexed file cut some bytes behind the start of its second keyframe; two more are in the index.
Bytes CutIndexed(int64_t bytes)
{
    int keys = 0;
    for (const Tag& tag : g_indexed.tags)
        if (tag.is_keyframe() && ++keys == 2)
            return Cut(g_indexed.bytes, tag.offset + bytes);
    return {};
}

const auto Cache = [](uint32_t size, uint32_t options = 0) { return OpenOptions{options, false, size}; };
const auto Buffer = [](uint32_t size, uint32_t options = USER) {
    return OpenOptions{options, false, 0, 0, FakeHost::DEFAULT_FILE, size};
};

// What a host sees of a call: its result, the code and the line recorded; then, of a failed open, the code and the
// line in the instance that it released.
using Outcome = std::vector<int32_t>;
using Fault = void (*)(FakeHost& host, uint64_t n);

constexpr Fault ALLOC = [](FakeHost& host, uint64_t n) { host.fail_nth(HostFn::Alloc, n); };
constexpr Fault OPEN = [](FakeHost& host, uint64_t n) { host.fail_nth(HostFn::Open, n); };
constexpr Fault READ = [](FakeHost& host, uint64_t n) { host.fail_nth(HostFn::Read, n); };
constexpr Fault SEEK = [](FakeHost& host, uint64_t n) { host.fail_nth(HostFn::Seek, n); };
constexpr Fault TELL = [](FakeHost& host, uint64_t n) { host.fail_nth(HostFn::Tell, n); };
constexpr Fault TELLS = [](FakeHost& host, uint64_t n) { host.fail_from(HostFn::Tell, n); };
constexpr Fault LATER_SEEK = [](FakeHost& host, uint64_t n) { host.fail_nth(HostFn::Seek, n + 1); };
constexpr Fault ALL_SEEKS = [](FakeHost& host, uint64_t) { host.fail_from(HostFn::Seek, 1); };
constexpr Fault TELL_AND_ALL_SEEKS = [](FakeHost& host, uint64_t n) { TELL(host, n), ALL_SEEKS(host, n); };
// The data ends so many bytes after the start of a read.
template <uint32_t bytes>
constexpr Fault END = [](FakeHost& host, uint64_t n) {
    host.shorten_nth(HostFn::Read, n, bytes);
    host.fail_nth(HostFn::Read, n + 1);
};

struct Failure {
    const char* what;
    Bytes file;
    OpenOptions open;
    Fault fault; // some n leads to the outcome; null: the file alone does
    Outcome expected;
    int request = 0; // the call that meets the fault: 0 the open, else the request of this number
    uint32_t stream = 0;
};

Outcome Run(const Failure& failure, uint64_t n, uint64_t* calls)
{
    FakeHost host(failure.file);
    Outcome released;
    host.on_release = [&released](const void* block, uint32_t size) {
        const auto* const ctx = static_cast<const flvd_ctx_t*>(block);
        if (size == sizeof(flvd_ctx_t))
            released = {ctx->error, ctx->error_line};
    };
    const auto arm = [&failure, &host, n](int call) {
        host.reset_calls();
        if (failure.fault != nullptr && call == failure.request)
            failure.fault(host, n);
    };
    arm(0);
    Session session(host, failure.open);
    int32_t rc = session.open_rc();
    for (int request = 1; session.opened() && request <= failure.request; ++request) {
        EXPECT_EQ(rc, 0);
        arm(request);
        rc = session.frame(failure.stream).rc;
    }
    *calls = std::max(*calls, host.failable_calls());
    Outcome outcome = {rc, session.last_error(), session.error_line()};
    EXPECT_TRUE(session.opened() || host.live_blocks() + host.open_handles() == 0);
    outcome.insert(outcome.end(), released.begin(), released.end());
    return outcome;
}

void ExpectProvoked(const std::vector<Failure>& failures)
{
    for (const Failure& failure : failures) {
        std::vector<Outcome> seen;
        uint64_t calls = failure.fault != nullptr ? 10 : 1; // at least: one that ends the open hides the others
        for (uint64_t n = 1; n <= calls && (seen.empty() || seen.back() != failure.expected); ++n) {
            seen.push_back(Run(failure, n, &calls));
            calls = failure.fault != nullptr ? calls : 1;
            seen.back().resize(failure.expected.size());
        }
        EXPECT_EQ(seen.back(), failure.expected) << failure.what << ", seen " << testing::PrintToString(seen);
    }
}

TEST(Failures, OfOpening)
{
    const auto header = [](uint32_t size) { return File({Pcm(0)}, 5, {}, size).bytes; };
    const Bytes bad_meta = File({{18, 0, {13}}, Pcm(0), Screen(0)}).bytes;
    const Bytes unseen = Repeat(BUDGET, g_meta, {Pcm(0)}).bytes;
    const Bytes far_signature = File({Pcm(0)}, 5, Noise(MIB + 1)).bytes;
    ExpectProvoked({
        {"instance", g_chain.bytes, {}, ALLOC, {-1, -4, 2335}},
        {"no such file", {}, {0, false, 0, 0, "b.flv"}, nullptr, {-4, -5, 2386}},
        {"main reader", g_chain.bytes, {}, OPEN, {-4, -5, 2386}},
        {"main reader's cache", g_chain.bytes, {USER}, ALLOC, {-4, -5, 2386}},
        {"audio reader", g_chain.bytes, {SEPARATE}, OPEN, {-4, -6, 2396}},
        {"audio reader's cache", g_chain.bytes, {SEPARATE | USER}, ALLOC, {-4, -6, 2396}},
        {"frame buffer", g_chain.bytes, {}, ALLOC, {-1, -7, 2413}},
        {"no signature", Noise(5000), {}, nullptr, {-1, -1004, 2423}},
        {"signature too far", far_signature, {}, nullptr, {-1, -1004, 2423}},
        {"8 bytes", Cut(g_chain.bytes, 8), {GROWING}, nullptr, {-1, -1004, 2423}},
        {"data offset 8", header(8), {GROWING}, nullptr, {-1, -1004, 2423}},
        {"negative data offset", header(0x80000010), {GROWING}, nullptr, {-1, -1004, 2423}},
        {"data offset at the end", Cut(header(9), 9), {}, nullptr, {-1, -1004, 2423}},
        {"data offset in front of the end", Cut(header(9), 10), {}, nullptr, {-1, -1002, 2458}},
        {"data offset behind the end, growing", header(0x7FFFFFFF), {GROWING}, nullptr, {-1, -1002, 2434}},
        {"seek to the end", g_chain.bytes, {}, SEEK, {-1, -1004, 2423}},
        {"file size", g_chain.bytes, {}, TELL, {-1, -1004, 2423}},
        {"growing: to the first tag", g_chain.bytes, {GROWING}, SEEK, {-1, -1002, 2434}},
        {"growing: no stream", File({g_meta}).bytes, {GROWING}, nullptr, {-1, -1002, 2434}},
        {"growing: behind bad metadata", bad_meta, {GROWING}, LATER_SEEK, {-1, -1002, 2434}},
        {"growing: behind a tag", Repeat(9, Pcm(0, 900), {}).bytes, Cache(SMALL, GROWING), SEEK, {-2, -10002, 2440}},
        {"growing: back to the first tag", g_chain.bytes, {GROWING}, SEEK, {-1, -2, 2496}},
        {"to the first tag", g_chain.bytes, {}, LATER_SEEK, {-1, -1002, 2458}},
        {"no stream in the first tags", unseen, {}, nullptr, {-1, -1002, 2458}},
        {"growing: no stream in the first tags", unseen, {GROWING}, nullptr, {-1, -1002, 2434}},
        {"back to the first tag", g_chain.bytes, {}, SEEK, {-1, -2, 2496}},
    });
}

TEST(Failures, OfExtentProbing)
{
    const auto inner = [](int32_t code, int32_t line) { return Outcome{-1, -1005, 2465, code, line}; };
    const Bytes trailing = Concat({g_indexed.bytes, Noise(50)});
    const Bytes inside = CutIndexed(20);
    const Bytes behind = CutIndexed(900);
    ExpectProvoked({
        {"quick: last tag", g_chain.bytes, {0, true}, TELL, inner(-1, 226)},
        {"quick: seek", g_chain.bytes, {0, true}, SEEK, inner(-2, 241)},
        {"quick: step", g_chain.bytes, {0, true}, TELL, inner(-10001, 248)},
        {"last tag", g_chain.bytes, {}, TELL, inner(-1, 479)},
        {"no last tag", g_chain.bytes, {}, SEEK, inner(-10001, 486)},
        {"walk: seek", g_chain.bytes, {}, SEEK, inner(-2, 503)},
        {"walk: step", g_chain.bytes, {}, TELL, inner(-10001, 510)},
        {"index: positions", g_indexed.bytes, {}, SEEK, inner(-2, 308)},
        {"index: last tag", g_indexed.bytes, {}, TELL, inner(-1, 375)},
        {"index: times", g_indexed.bytes, {}, SEEK, inner(-2, 449)},
        {"index: positions again", trailing, {}, SEEK, inner(-2, 405)},
        {"index in memory: last inside", behind, {INDEX}, SEEK, inner(-2, 338)},
        {"index: forward", behind, {}, TELL, inner(-1, 347)},
        {"index: last inside again", inside, {INDEX}, SEEK, inner(-2, 357)},
        {"index: backward", inside, {INDEX}, TELL, inner(-1, 364)},
        {"index: neither forward nor backward", inside, {INDEX}, TELLS, inner(-1, 375)},
    });
}

TEST(Failures, OfCodecProbes)
{
    // Another stream is sound, so that a complete file opens with the failure still recorded.
    const auto video = [](const Bytes& data) { return File({Pcm(0), Pcm(9), Video(0, data)}).bytes; };
    const auto audio = [](const Bytes& data) { return File({Screen(0), Screen(9), Audio(0, data)}).bytes; };
    const auto first = [](const Tag& tag) { return File({tag, Pcm(9), Screen(9)}).bytes; };
    const auto growing = [](const Tag& tag, int64_t size) { return Cut(File({tag}, 0).bytes, 13 + size); };
    const auto cut_short = [](int32_t line) { return Outcome{-2, -10002, 2440, -10002, line}; };
    const auto coded = [](uint8_t codec, const Bytes& payload) { return VideoData(1, codec, payload); };
    const Bytes blank(200, 0xFF);
    const Bytes no_frame_header(200, 0x80);
    const Tag mp3 = Audio(0, AudioData(SOUND_MP3, Mp3Frame(LARGE)));
    const Tag mp3_8k = Audio(0, AudioData(SOUND_MP3_8K, Mp3Frame()));
    const Tag h263 = Video(0, coded(CODEC_H263, H263Picture(2)));
    const Bytes no_set = AvcRecord({}, {{0x68, 0xCE, 0x3C, 0x80}});
    ExpectProvoked({
        {"audio byte", first(mp3), Cache(SMALL), END<11>, {-1, -1002, 2458, -10002, 659}},
        {"AAC packet type", first(Raw(0, LARGE)), Cache(SMALL), END<12>, {0, -10002, 659}},
        {"MP3 data", first(mp3), Cache(SMALL), END<15>, {0, -10002, 694}},
        {"growing: MP3 data", growing(mp3, 15), {GROWING}, nullptr, cut_short(694)},
        {"MP3 header", audio(AudioData(SOUND_MP3, no_frame_header)), {}, nullptr, {0, -3003, 700}},
        {"AAC above the cache", audio(AacConfig(Noise(SMALL))), Cache(SMALL), nullptr, {0, -10002, 741}},
        {"AAC without room", audio({SOUND_AAC}), {}, nullptr, {0, -3, 752}},
        {"AAC memory", audio(AacConfig({0x12, 0x10})), {}, ALLOC, {0, -3, 752}},
        {"growing: MP3 8 kHz data", growing(mp3_8k, 13), {GROWING}, nullptr, cut_short(781)},
        {"MP3 8 kHz header", audio(AudioData(SOUND_MP3_8K, no_frame_header)), {}, nullptr, {0, -3003, 787}},
        {"video bytes", first(Screen(0, LARGE)), Cache(SMALL), END<12>, {-1, -1002, 2458, -10002, 818}},
        {"H.263 data", video(coded(CODEC_H263, H263Picture(2, 0, 0, 50))), {}, nullptr, {0, -10002, 841}},
        {"growing: H.263 data", growing(h263, 127), {GROWING}, nullptr, cut_short(841)},
        {"H.263 header", video(coded(CODEC_H263, blank)), {}, nullptr, {0, -3002, 847}},
        {"VP6 data", video(coded(CODEC_VP6, Vp6Picture(false, 4, 3, 0, 50))), {}, nullptr, {0, -10002, 863}},
        {"VP6 header", video(coded(CODEC_VP6, blank)), {}, nullptr, {0, -3002, 869}},
        {"VP6A data", video(coded(CODEC_VP6A, Vp6Picture(true, 4, 3, 0, 50))), {}, nullptr, {0, -10002, 881}},
        {"VP6A header", video(coded(CODEC_VP6A, blank)), {}, nullptr, {0, -3002, 887}},
        {"AVC above the cache", video(AvcConfig(Noise(SMALL))), Cache(SMALL), nullptr, {0, -10002, 913}},
        {"AVC without room", video({0x17, 0, 0, 0}), {}, nullptr, {0, -3, 924}},
        {"AVC memory", video(AvcConfig(SmallAvcRecord())), {}, ALLOC, {0, -3, 924}},
        {"AVC record of 0 bytes", video({0x17, 0, 0, 0, 0}), {}, nullptr, {0, -3001, 932}},
        {"AVC record", video(AvcConfig(blank)), {}, nullptr, {0, -3001, 932}},
        {"AVC parameter set", video(AvcConfig(no_set)), {}, nullptr, {0, -3002, 938}},
        {"growing: no AVC header", first(Nalu(0)), {GROWING}, nullptr, {0, -3004, 946}},
    });
}

TEST(Failures, OfDelivery)
{
    const Bytes sound = File({Pcm(0), Pcm(9)}, 4).bytes;
    const Bytes pictures = File({Screen(0), Screen(9)}, 1).bytes;
    const Bytes avc = File({g_avc, Nalu(0, LARGE)}).bytes;
    const Bytes aac = File({g_aac, Raw(0)}).bytes;
    const int end = static_cast<int>(g_chain.frames().size()) + 1;
    std::vector<Failure> failures = {
        {"end", g_chain.bytes, {}, nullptr, {-2, -10002, 2737}, end},
        {"growing: end", g_chain.bytes, {GROWING}, nullptr, {-2, -10002, 2957}, end},
        {"growing: on from the end", g_chain.bytes, {GROWING}, SEEK, {-1, -2, 2830}, end},
        {"growing: position", g_chain.bytes, {GROWING}, TELL, {-1, -1, 2840}, 1},
        {"growing: back from the end", g_chain.bytes, {GROWING}, SEEK, {-1, -2, 2933}, end},
        {"growing: back from no tag", g_chain.bytes, {GROWING}, TELL_AND_ALL_SEEKS, {-1, -2, 2945}, 1},
        {"growing: back from a picture", Cut(avc, -5), {GROWING}, ALL_SEEKS, {-1, -2, 2881}, 1},
        {"growing: back from behind it", Cut(avc, -4), {GROWING}, ALL_SEEKS, {-1, -2, 2859}, 1},
        {"growing: back from a sound", Cut(aac, -5), {GROWING}, ALL_SEEKS, {-1, -2, 2921}, 1},
        {"growing: back from behind it", Cut(aac, -1), {GROWING}, ALL_SEEKS, {-1, -2, 2899}, 1},
        {"growing: back from a configuration", Cut(File({g_aac}).bytes, -1), {GROWING}, ALL_SEEKS, {-1, -2, 2899}, 1},
        {"growing: back from no room", Cut(avc, -2), Buffer(1000, USER | GROWING), ALL_SEEKS, {-1, -2, 2859}, 1},
    };
    const auto one_tag = [&failures](const Tag& config, const auto& frame, std::array<int32_t, 3> lines) {
        const auto file = [&](size_t size) {
            return File({g_meta, config, frame(0, size), frame(40), frame(80)}).bytes;
        };
        const int request = config.is_frame() ? 2 : 1;
        failures.push_back({"user's buffer", file(5000), Buffer(1000), nullptr, {0, 0, lines[0]}, request});
        failures.push_back({"growth", file(GROWN), {}, ALLOC, {0, 0, lines[0]}, request});
        failures.push_back({"peek", file(LARGE), Cache(SMALL), READ, {0, -10002, lines[1]}, request});
        failures.push_back({"read", file(LARGE), Cache(SMALL), READ, {0, -10002, lines[2]}, request});
    };
    one_tag(g_avc, Nalu, {2602, 2579, 2606});
    one_tag(g_aac, Raw, {2536, 2521, 2540});
    one_tag(Pcm(0), Pcm, {2550, 2521, 2554});
    for (const bool growing : {false, true}) {
        const uint32_t options = growing ? GROWING | SEPARATE : SEPARATE;
        const auto line = [growing](int32_t complete, int32_t other) { return growing ? other : complete; };
        failures.push_back({"info", sound, {options, true}, nullptr, {-1, -4007, line(2638, 2767)}, 1, 2});
        failures.push_back({"no video", sound, {options}, nullptr, {-1, -4002, line(2651, 2783)}, 1, 1});
        failures.push_back({"no audio", pictures, {options}, nullptr, {-1, -4003, line(2661, 2796)}, 1, 2});
        for (const uint32_t stream : {0u, 3u})
            failures.push_back({"stream", sound, {options}, nullptr, {-1, -4004, line(2667, 2802)}, 1, stream});
    }
    ExpectProvoked(failures);
}

TEST(EntryPoint, RefusesWhatItCannotServe)
{
    FakeHost host(g_chain.bytes);
    Session session(host);
    flvd_ctx_t* none = nullptr;
    flvd_ctx_t** const no_handle = nullptr;
    flvd_ctx_t* live = session.ctx();
    const flvd_init_t init = host.init();
    flvd_open_info_t info{};
    const flvd_frame_request_t request{};
    flvd_frame_t frame{};
    const auto expect = [&](uint32_t operation, flvd_ctx_t** handle, const void* arg1, void* arg2, int32_t rc) {
        g_flvd_lLastError = 77;
        g_flvd_lErrorLine = 78;
        EXPECT_EQ(QVX_FLV_DMX(operation, handle, arg1, arg2), rc) << operation;
        EXPECT_EQ(g_flvd_lLastError, rc == -3 ? -4001 : 77) << operation;
        EXPECT_EQ(g_flvd_lErrorLine, rc == -3 ? 2273 : 78) << operation;
        for (flvd_ctx_t** const without : {&none, no_handle})
            EXPECT_EQ(QVX_FLV_DMX(FLVD_OP_GET_LAST_ERROR, without, nullptr, nullptr), g_flvd_lLastError);
        EXPECT_EQ(live, session.ctx());
        EXPECT_EQ(session.last_error(), 0);
    };
    for (flvd_ctx_t** const without : {&none, no_handle}) {
        for (const uint32_t operation : {FLVD_OP_CLOSE, FLVD_OP_GET_FRAME, FLVD_OP_SEEK})
            expect(operation, without, &request, &frame, -3);
        expect(FLVD_OP_RESERVED, without, nullptr, nullptr, -1);
    }
    for (const uint32_t operation : {FLVD_OP_OPEN, FLVD_OP_OPEN_INFO, FLVD_OP_GET_FRAME, FLVD_OP_SEEK}) {
        const bool opens = operation == FLVD_OP_OPEN || operation == FLVD_OP_OPEN_INFO;
        expect(operation, no_handle, &init, &info, opens ? -1 : -3);
        expect(operation, &live, nullptr, &info, -1);
        expect(operation, &live, &init, nullptr, -1);
    }
    for (const uint32_t operation : {6u, 7u, 8u, 9u, 11u, 0xFFFFFFFFu})
        expect(operation, &live, &init, &info, -1);
    EXPECT_EQ(QVX_FLV_DMX(FLVD_OP_RESERVED, &live, nullptr, nullptr), -1);
    EXPECT_EQ(session.last_error(), -4006);
    EXPECT_EQ(session.error_line(), 3420);

    FakeHost empty(Bytes{});
    const flvd_init_t empty_init = empty.init();
    EXPECT_EQ(QVX_FLV_DMX(FLVD_OP_OPEN, &live, &empty_init, &info), -1);
    EXPECT_EQ(live, nullptr); // a failed open stores it
}

TEST(Open, BoundsTheSizesOfTheInitialisationBlock)
{
    const uint32_t cases[][4] = {{0, 0, 4096, 16},           {1, 5, 1024, 5},          {100, 0, 1024, 16},
                                 {1023, 100000, 1024, 1024}, {1024, 1024, 1024, 1024}, {5000, 100000, 5000, 5000}};
    for (const auto& [cache, scan, cache_taken, scan_taken] : cases) {
        FakeHost host(g_chain.bytes);
        const Session session(host, {0, false, cache, scan});
        EXPECT_EQ(session.ctx()->cache_size, cache_taken);
        EXPECT_EQ(session.ctx()->main_reader->capacity, cache_taken);
        EXPECT_EQ(session.ctx()->scan_read_size, scan_taken) << cache << " " << scan;
    }
}

TEST(Open, TakesInOrderAndReleasesInOrder)
{
    constexpr uint32_t UNKNOWN = 0xFFFFFFF0; // options without a meaning
    constexpr uint32_t CTX = sizeof(flvd_ctx_t);
    constexpr uint32_t FIO = sizeof(fio_file_t);
    const auto config = static_cast<uint32_t>(SmallAvcRecord().size());
    const auto number = [](size_t n) { return std::to_string(n); };
    const std::string reader = " open(a.flv,rb)=1 alloc(" + number(FIO) + ")=1 alloc(4096)=1";
    const std::string begin = "alloc(" + number(CTX) + ")=1 set(0," + number(CTX) + ")= set(0," +
                              number(sizeof(flvd_open_info_t)) + ")=" + reader;
    const std::tuple<OpenOptions, std::string, std::vector<uint32_t>> cases[] = {
        {{SEPARATE | INDEX | UNKNOWN},
         begin + reader + " alloc(512000)=1 read(",
         {4096, FIO, 4096, FIO, config, 2, 512000, 16, 32, CTX}},
        {{SEPARATE | USER, true}, begin + " read(", {4096, FIO, config, 2, CTX}}};
    for (const auto& [open, taken, released] : cases) {
        FakeHost host(g_indexed.bytes);
        host.start_log(true);
        Session session(host, open);
        EXPECT_EQ(host.take_log().substr(0, taken.size()), taken);
        EXPECT_EQ(session.ctx()->audio_reader == session.ctx()->main_reader, open.for_info);
        std::vector<uint32_t> sizes;
        host.on_release = [&sizes](const void*, uint32_t size) { sizes.push_back(size); };
        EXPECT_EQ(session.close(), 0);
        EXPECT_EQ(sizes, released);
        EXPECT_EQ(host.open_handles(), 0u);
    }
}

TEST(Open, FindsTheSignatureInTheFirstMebibyte)
{
    for (const Bytes& prefix : {Bytes{}, Bytes{'F', 'L'}, Noise(5), Noise(5000), Noise(MIB)}) {
        const uint32_t header = prefix.size() < MIB ? 12 : 9; // behind so many bytes the builder does not fill it up
        Flv flv = File({Pcm(0), Screen(5), Pcm(9)}, 5, prefix, header);
        if (prefix.size() == MIB)
            flv.bytes[MIB] = 'X'; // there it is taken for one whatever it is
        FakeHost host(flv.bytes);
        Session session(host);
        EXPECT_EQ(play(session), flv.frames()) << prefix.size();
    }
}

TEST(Probing, FindsStreamsAndTimes)
{
    struct Case {
        const char* what;
        Flv file;
        uint32_t options;
        uint32_t streams, first_ts, duration, method;
    };
    const Tag bad_avc = Video(0, AvcConfig(Bytes(9, 0xFF)));
    const Tag script = {18, 0, amf::OnMetaData({{"text", amf::String(std::string(224, 'x'))}})};
    ASSERT_EQ(script.data.size() + 11, 0x109u); // a back-pointer that passes for a video tag
    const Case cases[] = {
        {"AVC configuration", File({g_avc, Nalu(40), Nalu(90)}, 1), 0, 1, 40, 50, 2},
        {"AAC configuration", File({g_aac, Raw(23), Raw(46)}, 4), 0, 2, 23, 23, 2},
        {"every sound", File({Pcm(10), Pcm(30)}, 4), 0, 2, 10, 20, 2},
        {"no picture but AVC", File({Screen(10), Pcm(50), Screen(60)}), 0, 3, 50, 10, 2},
        {"pictures alone", File({Screen(10), Screen(60)}, 1), 0, 1, 0, 60, 2},
        {"smallest", File({g_avc, g_aac, Raw(50), Nalu(40), Nalu(90)}), 0, 3, 40, 50, 2},
        {"first when all is found", File({g_meta, g_avc, g_aac, Raw(50), Nalu(40), Nalu(90)}), 0, 3, 50, 40, 2},
        {"no stream announced", File({g_meta, g_avc, g_aac, Raw(50), Nalu(60)}, 0), 0, 3, 50, 10, 2},
        {"one announced", File({g_avc, g_aac, Raw(20), Nalu(30)}, 4), 0, 3, 20, 10, 2},
        {"one missing", File({Pcm(0), Pcm(9)}), 0, 2, 0, 9, 2},
        {"within the budget", Repeat(BUDGET - 1, Pcm(0), {Screen(0), Pcm(5)}), 0, 3, 0, 5, 2},
        {"beyond the budget", Repeat(BUDGET, Pcm(0), {Screen(0), Pcm(5)}), 0, 2, 0, 5, 2},
        {"behind scripts", Repeat(BUDGET - 1, g_meta, {Pcm(3), Pcm(9)}), 0, 2, 3, 6, 2},
        {"last below first", File({g_meta, Pcm(5000), Pcm(100)}, 4), 0, 2, 0, 0, 0},
        {"second configuration", File({bad_avc, g_avc, Nalu(40), Nalu(90)}, 1), 0, 1, 40, 50, 2},
        {"growing", File({g_avc, Nalu(40), Nalu(90)}, 1), GROWING, 1, 0, 0, 0},
        {"growing behind a script", File({script, g_avc, Nalu(40), Nalu(90)}, 1), GROWING, 1, 0, 0, 0},
        {"index", g_indexed, 0, 3, 0, 782, 1},
        {"growing with index", g_indexed, GROWING, 3, 0, 0, 1},
        {"one entry", Indexed(100), 0, 3, 0, 782, 0},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.what);
        FakeHost host(c.file.bytes);
        Session session(host, {c.options});
        ASSERT_TRUE(session.opened());
        const flvd_open_info_t& info = session.info();
        const flvd_file_info_t& file = *info.file_info;
        const flvd_ctx_t* const ctx = session.ctx();
        const auto* const video = (c.streams & FLVD_STREAM_VIDEO) != 0 ? &ctx->video_info : nullptr;
        const auto* const audio = (c.streams & FLVD_STREAM_AUDIO) != 0 ? &ctx->audio_info : nullptr;
        EXPECT_EQ(std::tie(info.video_info, info.video_config), std::tuple(video, video));
        EXPECT_EQ(std::tie(info.audio_info, info.audio_config), std::tuple(audio, audio));
        EXPECT_EQ(info.has_video + 2 * info.has_audio, c.streams);
        EXPECT_EQ(std::tie(ctx->streams, ctx->first_ts), std::tie(c.streams, c.first_ts));
        EXPECT_EQ(std::tie(file.duration_ms, file.seek_method), std::tie(c.duration, c.method));
        EXPECT_EQ(file.file_size, c.options != 0 ? 0 : host.visible());
        EXPECT_STREQ(file.file_name, "a.flv");
        const bool avc =
            std::any_of(c.file.tags.begin(), c.file.tags.end(), [](const Tag& tag) { return tag.data == g_avc.data; });
        const Bytes record(ctx->video_info.config, ctx->video_info.config + ctx->video_info.config_size);
        EXPECT_EQ(record, avc ? SmallAvcRecord() : Bytes{});
        const Frames frames = c.file.frames(FLVD_STREAM_VIDEO | FLVD_STREAM_AUDIO, c.first_ts);
        EXPECT_EQ(play(session), frames);
        uint32_t last[3] = {};
        for (const Frame& frame : frames)
            last[frame.stream] = frame.timestamp;
        EXPECT_EQ(std::tie(ctx->last_video_ts, ctx->last_audio_ts), std::tie(last[1], last[2]));
    }
}

TEST(Probing, DerivesTheByteRate)
{
    FakeHost host(File({Pcm(0, 50000), Pcm(10000, 49955)}, 4).bytes);
    ASSERT_EQ(host.visible(), 100000);
    const Session session(host);
    EXPECT_EQ(session.ctx()->byte_rate, 10240u);
}

TEST(Delivery, GivesThePayloadsBehindTheCodecBytes)
{
    const auto odd = [](uint8_t type) { return Video(50, AvcNalu(false, Noise(30), 0, type)); };
    const Flv files[] = {
        g_chain,
        File({g_avc, Nalu(0), odd(3), odd(0xFF), odd(2), g_avc, Video(60, AvcEnd()), Nalu(80)}, 1),
        File({g_aac, Raw(0), Audio(23, {SOUND_AAC, 2, 7}), g_aac, Raw(46)}, 4),
        File({Audio(0, AudioData(SOUND_MP3, Mp3Frame())), Screen(0), Screen(20, 0), Audio(26, {SOUND_MP3, 1}),
              Screen(40)}),
        File({Audio(0, AudioData(SOUND_SPEEX, Noise(42))), Video(0, VideoData(1, 9, Noise(70))), Video(9, {0x29, 4})}),
        // Too short for their codec bytes.
        File({g_avc, g_aac, Raw(0), Video(10, {0x27, 1, 0, 0}), Audio(12, {SOUND_AAC}), Video(15, {0x27}), Raw(20),
              Video(21, {0x27, 1, 0, 0, 0}), Audio(22, {SOUND_AAC, 1}), Nalu(40), Raw(46)}),
        File({g_avc, Nalu(0, LARGE), Nalu(40, GROWN), Nalu(80, LARGE), Nalu(120)}, 1),
    };
    const OpenOptions modes[] = {{}, Cache(SMALL), Buffer(1u << 20), {GROWING}, Cache(SMALL, GROWING)};
    for (const Flv& flv : files) {
        for (const OpenOptions& mode : modes) {
            SCOPED_TRACE(std::to_string(&flv - files) + " with mode " + std::to_string(&mode - modes));
            FakeHost host(flv.bytes);
            Session session(host, mode);
            int32_t rc = 0;
            EXPECT_EQ(play(session, 0, &rc), flv.frames());
            EXPECT_EQ(rc, -2);
        }
        for (const uint32_t options : {SEPARATE, SEPARATE | GROWING}) {
            FakeHost host(flv.bytes);
            Session session(host, {options});
            Frames got[2];
            for (uint32_t n = 0, failed = 0; failed < 2; ++n) { // in turn, until both have ended
                FrameResult result = session.frame(1 + n % 2);
                failed = result.rc != 0 ? failed + 1 : 0;
                if (result.rc == 0)
                    got[n % 2].push_back(std::move(result.frame));
            }
            EXPECT_EQ(got[0], flv.frames(FLVD_STREAM_VIDEO)) << &flv - files;
            EXPECT_EQ(got[1], flv.frames(FLVD_STREAM_AUDIO)) << &flv - files;
        }
    }
}

TEST(Delivery, GrowsItsBufferInSteps)
{
    FakeHost host(File({g_avc, Nalu(0, LARGE), Nalu(40, GROWN), Nalu(80, GROWN), Nalu(120)}, 1).bytes);
    Session session(host);
    EXPECT_EQ(play(session).size(), 4u);
    EXPECT_EQ(session.ctx()->frame_buffer_size, 606208u);
    Session poor(host);
    host.fail_from(HostFn::Alloc, host.calls(HostFn::Alloc) + 1);
    EXPECT_EQ(play(poor).size(), 1u); // later frames fit no buffer: it is lost
    EXPECT_EQ(poor.ctx()->frame_buffer, nullptr);
    EXPECT_EQ(poor.ctx()->frame_buffer_size, 0u);
}

TEST(Delivery, EndsARequestAfterItsBudget)
{
    for (const uint32_t options : {0u, GROWING}) {
        for (const size_t configurations : {BUDGET - 1, BUDGET}) {
            const bool within = configurations < BUDGET;
            FakeHost host(Repeat(configurations, g_avc, {Nalu(0), Nalu(40)}, 1).bytes);
            Session session(host, {options});
            EXPECT_EQ(session.frame().rc, within ? 0 : -2);
            EXPECT_EQ(session.error_line(), within ? 0 : options != 0 ? 2957 : 2737);
            EXPECT_EQ(play(session).size(), within ? 1u : 2u);
        }
    }
}

// Whether the host has been asked for the tag before it is whole or not.
TEST(Delivery, TakesATagBackUntilItIsWhole)
{
    const Flv flv = File({g_avc, g_aac, Nalu(0), g_avc, Raw(40)});
    const int64_t before = flv.tags[2].end();
    for (int64_t shown = before; shown < flv.tags.back().end(); ++shown) {
        for (const int requests : {0, 1, 2}) {
            SCOPED_TRACE(shown);
            FakeHost host(flv.bytes);
            host.set_visible(shown);
            Session session(host, {GROWING});
            EXPECT_EQ(session.frame().rc, 0);
            for (int i = 0; i < requests; ++i) {
                const FrameResult result = session.frame();
                EXPECT_EQ(std::tuple(result.rc, session.error_line(), session.ctx()->saved_main_pos),
                          std::tuple(-2, 2957, 0));
                EXPECT_EQ(result.frame, Frame{}); // cleared by every request
            }
            host.set_visible(INT64_MAX);
            Frames rest = play(session);
            if (requests == 0 && shown > before && rest.empty()) // a part was read already, and then the end
                rest = play(session);
            EXPECT_EQ(rest, Frames{flv.frames().back()});
        }
    }
}

TEST(Delivery, TriesAFailedRollBackAgain)
{
    const Flv flv = File({g_avc, g_aac, Nalu(0), Raw(0)});
    for (const uint32_t options : {GROWING, GROWING | SEPARATE}) {
        FakeHost host(flv.bytes);
        host.set_visible(flv.tags[3].end() - 1);
        Session session(host, {options});
        EXPECT_EQ(session.frame(FLVD_STREAM_VIDEO).rc, 0);
        const flvd_ctx_t* const ctx = session.ctx();
        const int64_t& saved = options != GROWING ? ctx->saved_audio_pos : ctx->saved_main_pos;
        host.fail_from(HostFn::Seek, 1);
        for (const int32_t line : {2899, 2830, 2830}) {
            EXPECT_EQ(session.frame(FLVD_STREAM_AUDIO).rc, -1);
            EXPECT_EQ(session.error_line(), line);
            EXPECT_GT(saved, 0);
            EXPECT_EQ(ctx->saved_audio_pos + ctx->saved_main_pos, saved);
        }
        host.fail_nothing();
        host.set_visible(INT64_MAX);
        EXPECT_EQ(play(session, FLVD_STREAM_AUDIO), flv.frames(FLVD_STREAM_AUDIO));
    }
}

TEST(Delivery, GivesNothingButPayloadsWhenASeekFails)
{
    const Flv flv = File({Screen(0, 5000), Screen(40, 5000), Screen(80, 5000)}, 1);
    const Frames whole = flv.frames(FLVD_STREAM_VIDEO, 0);
    for (uint64_t n = 1; n <= 12; ++n) {
        FakeHost host(flv.bytes);
        Session session(host);
        host.reset_calls();
        host.fail_nth(HostFn::Seek, n);
        for (const Frame& frame : play(session))
            EXPECT_NE(std::find(whole.begin(), whole.end(), frame), whole.end()) << n;
    }
}

} // namespace
