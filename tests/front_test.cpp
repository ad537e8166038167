// Opening, probing and delivery as the host sees them, and every site where they can fail.

#include "support/report.h"
#include "support/session.h"

#include <algorithm>
#include <regex>
#include <tuple>

using namespace flvd_test;

namespace {

using enum Site;

constexpr size_t BUDGET = 102; // tags that a request or a probe handles
constexpr uint32_t MIB = 0x100000;
constexpr uint8_t SOUND_MP3_8K = 0xEF, SOUND_AAC = 0xAF;

const auto Video = [](uint32_t ts, const Bytes& data) { return Tag{9, ts, data}; };
const auto Audio = [](uint32_t ts, const Bytes& data) { return Tag{8, ts, data}; };

Flv Repeat(size_t n, const Tag& tag, const Tags& then, uint8_t flags = 5)
{
    return File(Tags(n, tag) + then, flags);
}

const auto Damaged = [](Tag tag) {
    tag.back_pointer = 0xEEEEEEEE;
    return tag;
};
const auto Cut = [](const Bytes& bytes, size_t size) { return Bytes(bytes.data(), bytes.data() + size); };
const auto Indexed = [](uint32_t gop) { return MakeChain({true, true, true, true, 20, gop}); };
const Flv g_chain = MakeChain();
const Flv g_indexed = Indexed(5);

const auto Cache = [](uint32_t size, uint32_t options = 0) { return OpenOptions{options, false, size}; };
const auto Buffer = [](uint32_t size, uint32_t options = 0) {
    return OpenOptions{.options = options | USER, .user_buffer_size = size};
};

// An open or a request, and what the host sees of it.
struct Row {
    const char* what;
    Bytes file = {};
    OpenOptions open = {};
    std::optional<Site> site = {};        // recorded; if the operation cannot fail there, the call succeeds
    std::optional<Site> in_instance = {}; // recorded in the instance that a failed open releases; empty: anything
    int before = 0;                       // requests before this one
    uint32_t stream = 0;                  // requested
    HostFault fault = {};                 // in this request
    std::optional<uint32_t> time = {};    // of the frame delivered; if this request fails, by the next one
};

void Expect(const Row& row, Op op)
{
    SCOPED_TRACE(std::string(row.what) + ((row.open.options & GROWING) != 0 ? ", growing" : ""));
    FakeHost host(row.file);
    host.on_release = [&row](const void* block, uint32_t size) {
        const auto* const ctx = static_cast<const flvd_ctx_t*>(block);
        EXPECT_TRUE(size != sizeof(*ctx) || !row.in_instance ||
                    At(*row.in_instance).records(ctx->error, ctx->error_line));
    };
    Session session(host, row.open);
    host.on_release = nullptr;
    FrameResult got = {session.open_rc(), {}};
    for (int i = 0; i <= row.before && op == Op::Frame; ++i) {
        host.reset_calls();
        host.fail(i == row.before ? row.fault : HostFault{});
        got = session.frame(row.stream);
    }
    EXPECT_EQ(got.rc, row.site && At(*row.site).op == op ? At(*row.site).result() : 0);
    EXPECT_TRUE(session.recorded(row.site)) << session.last_error() << " / " << session.error_line();
    if (got.rc != 0 && row.time)
        got = session.frame(row.stream);
    EXPECT_TRUE(!row.time || got.frame.timestamp == *row.time) << got.frame.timestamp;
}

TEST(Failures, OfOpening)
{
    const auto header = [](uint32_t size) { return File({Pcm(0)}, 5, {}, size).bytes; };
    const Bytes far = File({Pcm(0)}, 5, Noise(MIB + 1)).bytes, script = File({g_meta}).bytes;
    const Bytes unseen = Repeat(BUDGET, g_meta, {Pcm(0)}).bytes;
    const Row rows[] = {
        {.what = "no signature", .file = Noise(5000), .site = OPEN_FILE_HEADER},
        {.what = "signature too far", .file = far, .site = OPEN_FILE_HEADER},
        {.what = "8 bytes", .file = Cut(g_chain.bytes, 8), .open = {GROWING}, .site = OPEN_FILE_HEADER},
        {.what = "data offset 8", .file = header(8), .open = {GROWING}, .site = OPEN_FILE_HEADER},
        {.what = "data offset -", .file = header(1u << 31), .open = {GROWING}, .site = OPEN_FILE_HEADER},
        {.what = "data offset at the end", .file = Cut(header(9), 9), .site = OPEN_FILE_HEADER},
        {.what = "data offset before the end", .file = Cut(header(9), 10), .site = OPEN_NO_STREAM},
        {.what = "data offset past the end", .file = header(INT32_MAX), .open = {GROWING}, .site = OPEN_NO_STREAM},
        {.what = "no stream", .file = script, .open = {GROWING}, .site = OPEN_NO_STREAM},
        {.what = "no stream in the first tags", .file = unseen, .site = OPEN_NO_STREAM},
    };
    for (const Row& row : rows)
        Expect(row, Op::Open);
}

// The other stream is valid, so a complete file opens, and the failure stays recorded.
TEST(Failures, OfCodecProbes)
{
    const auto audio = [](uint8_t header, const Bytes& payload) {
        return File({Screen(0), Screen(9), Audio(0, AudioData(header, payload))}).bytes;
    };
    const auto video = [](uint8_t codec, const Bytes& payload) {
        return File({Pcm(0), Pcm(9), Video(0, VideoData(1, codec, payload))}).bytes;
    };
    const auto avc = [&video](const Bytes& record) { return video(7, Concat({{0, 0, 0, 0}, record})); };
    // A growing file with this many bytes after its header.
    const auto cut = [](const Tag& tag, size_t size) { return Cut(File({tag}, 0).bytes, 13 + size); };
    const Bytes blank(200, 0xFF), no_frame_header(200, 0x80), no_set = AvcRecord({}, {{0x68, 0xCE, 0x3C, 0x80}});
    const Bytes mp3 = cut(Audio(0, AudioData(SOUND_MP3, Mp3Frame())), 15);
    const Bytes mp3_8k = cut(Audio(0, AudioData(SOUND_MP3_8K, Mp3Frame())), 13);
    const Bytes h263 = cut(Video(0, VideoData(1, CODEC_H263, H263Picture(2))), 127);
    const Bytes large_aac = audio(SOUND_AAC, Concat({{0}, Noise(SMALL)}));
    const Bytes no_config = File({Nalu(0), Pcm(9), Screen(9)}).bytes;
    const Row rows[] = {
        {.what = "MP3 cut", .file = mp3, .open = {GROWING}, .site = OPEN_TAG_CUT, .in_instance = MP3_DATA},
        {.what = "8 kHz cut", .file = mp3_8k, .open = {GROWING}, .site = OPEN_TAG_CUT, .in_instance = MP3_8KHZ_DATA},
        {.what = "H.263 cut", .file = h263, .open = {GROWING}, .site = OPEN_TAG_CUT, .in_instance = H263_DATA},
        {.what = "MP3 header", .file = audio(SOUND_MP3, no_frame_header), .site = MP3_HEADER},
        {.what = "MP3 8 kHz header", .file = audio(SOUND_MP3_8K, no_frame_header), .site = MP3_8KHZ_HEADER},
        {.what = "AAC above the cache", .file = large_aac, .open = Cache(SMALL), .site = AAC_DATA},
        {.what = "AAC of one byte", .file = audio(SOUND_AAC, {}), .site = AAC_MEMORY},
        {.what = "H.263 data", .file = video(CODEC_H263, Noise(50)), .site = H263_DATA},
        {.what = "H.263 header", .file = video(CODEC_H263, blank), .site = H263_HEADER},
        {.what = "VP6 data", .file = video(CODEC_VP6, Noise(50)), .site = VP6_DATA},
        {.what = "VP6 header", .file = video(CODEC_VP6, blank), .site = VP6_HEADER},
        {.what = "VP6A data", .file = video(CODEC_VP6A, Noise(50)), .site = VP6A_DATA},
        {.what = "VP6A header", .file = video(CODEC_VP6A, blank), .site = VP6A_HEADER},
        {.what = "AVC above the cache", .file = avc(Noise(SMALL)), .open = Cache(SMALL), .site = AVC_DATA},
        {.what = "AVC without CompositionTime", .file = video(7, {0, 0, 0}), .site = AVC_MEMORY},
        {.what = "AVC record of 0 bytes", .file = avc({}), .site = AVC_CONFIG},
        {.what = "AVC record", .file = avc(blank), .site = AVC_CONFIG},
        {.what = "AVC parameter set", .file = avc(no_set), .site = AVC_PARAMETERS},
        {.what = "AVC without configuration", .file = no_config, .open = {GROWING}, .site = AVC_NO_SEQUENCE_HEADER},
    };
    for (const Row& row : rows)
        Expect(row, Op::Open);
}

TEST(Failures, OfDelivery)
{
    const Bytes audio = File({Pcm(0), Pcm(9)}, 4).bytes, video = File({Screen(0), Screen(9)}, 1).bytes;
    const auto large = [](const Tag& config, const auto& frame) {
        return File({g_meta, config, frame(0, 5000), frame(40), frame(80)}).bytes;
    };
    const int frames = static_cast<int>(g_chain.frames().size());
    const auto configs = [](size_t n) { return Repeat(n, g_avc, {Nalu(0)}, 1).bytes; };
    const Row rows[] = {
        // each also in a growing file
        {.what = "end of the data", .file = g_chain.bytes, .site = FRAME_END, .before = frames},
        {.what = "within the budget", .file = configs(BUDGET - 1), .time = 0},
        {.what = "beyond it", .file = configs(BUDGET), .site = FRAME_END, .time = 0},
        {.what = "AVC: no room", .file = large(g_avc, Nalu), .open = Buffer(1000), .site = VIDEO_NO_ROOM},
        {.what = "AAC: no room", .file = large(g_aac, Raw), .open = Buffer(1000), .site = AAC_NO_ROOM},
        {.what = "PCM: no room", .file = large(Pcm(0), Pcm), .open = Buffer(1000), .site = AUDIO_NO_ROOM, .before = 1},
        {.what = "information", .file = audio, .open = {SEPARATE, true}, .site = FRAME_INFO_ONLY, .stream = AUDIO},
        {.what = "no video", .file = audio, .open = {SEPARATE}, .site = FRAME_NO_VIDEO, .stream = VIDEO},
        {.what = "no audio", .file = video, .open = {SEPARATE}, .site = FRAME_NO_AUDIO, .stream = AUDIO},
        {.what = "stream 0", .file = audio, .open = {SEPARATE}, .site = FRAME_BAD_STREAM, .stream = 0},
        {.what = "stream 3", .file = audio, .open = {SEPARATE}, .site = FRAME_BAD_STREAM, .stream = 3},
    };
    for (Row row : rows)
        for (const uint32_t options : {row.open.options, row.open.options | GROWING}) {
            row.open.options = options;
            Expect(row, Op::Frame);
        }
}

TEST(Open, LimitsTheSizesOfTheInitialisationBlock)
{
    FakeHost host(g_chain.bytes);
    const auto expect = [&host](uint32_t cache, uint32_t scan, const OpenOptions& given) {
        const Session session(host, given);
        EXPECT_EQ(session.ctx()->cache_size, cache);
        EXPECT_EQ(session.ctx()->main_reader->capacity, cache);
        EXPECT_EQ(session.ctx()->scan_read_size, scan);
    };
    expect(4096, 16, {.cache_size = 0, .scan_read_size = 0});
    expect(1024, 5, {.cache_size = 1, .scan_read_size = 5});
    expect(1024, 1024, {.cache_size = 1023, .scan_read_size = 100000});
    expect(1025, 1025, {.cache_size = 1025, .scan_read_size = 1025});
}

TEST(Open, AcquiresAndReleasesInOrder)
{
    constexpr uint32_t UNKNOWN = 0xFFFFFFF0, CTX = sizeof(flvd_ctx_t), FIO = sizeof(fio_file_t);
    const auto config = static_cast<uint32_t>(SmallAvcRecord().size());
    const std::string ctx = std::to_string(CTX), info = std::to_string(sizeof(flvd_open_info_t));
    const std::string reader = " open(a.flv,rb)=1 alloc(" + std::to_string(FIO) + ")=1 alloc(4096)=1";
    const std::string begin = "alloc(" + ctx + ")=1 set(0," + ctx + ")= set(0," + info + ")=" + reader;
    const std::tuple<OpenOptions, std::string, std::vector<uint32_t>> cases[] = {
        {{SEPARATE | INDEX | UNKNOWN}, // options without a meaning
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
    }
}

TEST(Probing, FindsStreamsAndTimes)
{
    const Tag bad_avc = Video(0, AvcConfig(Bytes(9, 0xFF)));
    const Tag script = {18, 0, OnMetaData("text: 'x^224")};
    ASSERT_EQ(script.data.size() + 11, 0x109u); // its back-pointer looks like the start of a video tag
    const auto after = [](const Bytes& prefix, uint32_t header = 12) {
        return File({Pcm(0), Screen(5), Pcm(9)}, 5, prefix, header);
    };
    Flv far = after(Noise(MIB), 9);
    far.bytes[MIB] = 'X'; // at this distance, any byte is accepted as a signature
    const Flv video = File({g_avc, Nalu(40), Nalu(90)}, 1), aac = File({g_aac, Raw(23), Raw(46)}, 4);
    const Flv sorted = File({g_avc, g_aac, Raw(50), Nalu(40), Nalu(90)});
    const Flv all_found = File({g_meta, g_avc, g_aac, Raw(50), Nalu(40), Nalu(90)});
    const Tags late = {Screen(0), Pcm(5)};
    const Flv within = Repeat(BUDGET - 1, Pcm(0), late), beyond = Repeat(BUDGET, Pcm(0), late);
    const Flv scripts = Repeat(BUDGET - 1, g_meta, {Pcm(3), Pcm(9)}),
              unannounced = File({g_meta, g_avc, g_aac, Raw(50), Nalu(60)}, 0);
    const Flv second = File({bad_avc, g_avc, Nalu(40), Nalu(90)}, 1),
              script_first = File({script, g_avc, Nalu(40), Nalu(90)}, 1);
    const struct {
        const char* what;
        Flv file;
        uint32_t streams = BOTH, first_ts = 0, duration = 0, method = FLVD_SEEK_BY_SCAN;
        uint32_t options = 0;
    } probes[] = {
        {.what = "AVC configuration", .file = video, .streams = VIDEO, .first_ts = 40, .duration = 50},
        {.what = "AAC configuration", .file = aac, .streams = AUDIO, .first_ts = 23, .duration = 23},
        {.what = "any PCM tag", .file = File({Pcm(10), Pcm(30)}, 4), .streams = AUDIO, .first_ts = 10, .duration = 20},
        {.what = "only AVC video", .file = File({Screen(10), Pcm(50), Screen(60)}), .first_ts = 50, .duration = 10},
        {.what = "smallest time", .file = sorted, .first_ts = 40, .duration = 50},
        {.what = "first time once all is found", .file = all_found, .first_ts = 50, .duration = 40},
        {.what = "no stream announced", .file = unannounced, .first_ts = 50, .duration = 10},
        {.what = "one announced", .file = File({g_avc, g_aac, Raw(20), Nalu(30)}, 4), .first_ts = 20, .duration = 10},
        {.what = "video within the budget", .file = within, .duration = 5},
        {.what = "video beyond the budget", .file = beyond, .streams = AUDIO, .duration = 5},
        {.what = "after script data", .file = scripts, .streams = AUDIO, .first_ts = 3, .duration = 6},
        {.what = "last below first", .file = File({g_meta, Pcm(5000), Pcm(100)}, 4), .streams = AUDIO, .method = 0},
        {.what = "second configuration", .file = second, .streams = VIDEO, .first_ts = 40, .duration = 50},
        {.what = "growing", .file = script_first, .streams = VIDEO, .method = 0, .options = GROWING},
        {.what = "signature after its first two letters", .file = after({'F', 'L'}), .duration = 9},
        {.what = "signature after a cache", .file = after(Noise(5000)), .duration = 9},
        {.what = "signature after the first MiB", .file = far, .duration = 9},
        {.what = "index", .file = g_indexed, .duration = 782, .method = FLVD_SEEK_BY_INDEX},
        {.what = "growing, index", .file = g_indexed, .method = FLVD_SEEK_BY_INDEX, .options = GROWING},
        {.what = "index of one entry", .file = Indexed(100), .duration = 782, .method = FLVD_SEEK_NONE},
    };
    for (const auto& probe : probes) {
        SCOPED_TRACE(probe.what);
        FakeHost host(probe.file.bytes);
        Session session(host, {probe.options});
        ASSERT_TRUE(session.opened());
        const flvd_file_info_t& file = *session.info().file_info;
        const flvd_ctx_t& ctx = *session.ctx();
        EXPECT_EQ(ctx.streams, probe.streams);
        EXPECT_EQ(ctx.first_ts, probe.first_ts);
        EXPECT_EQ(file.duration_ms, probe.duration);
        EXPECT_EQ(file.seek_method, probe.method);
        EXPECT_EQ(file.file_size, probe.options != 0 ? 0 : host.visible());
        EXPECT_STREQ(file.file_name, "a.flv");
        EXPECT_EQ(ctx.byte_rate, probe.duration != 0 ? ctx.data_end * 1024 / probe.duration : 0); // per 1024 ms
        EXPECT_EQ(play(session), probe.file.frames(BOTH, probe.first_ts));
    }
}

TEST(Delivery, ReturnsThePayloadsAfterTheCodecBytes)
{
    const auto odd = [](uint8_t type) { return Video(50, AvcNalu(false, Noise(30), 0, type)); };
    const Flv files[] = {
        g_chain,
        File({g_avc, Nalu(0), odd(3), odd(0xFF), odd(2), g_avc, Video(60, g_avc_end), Nalu(80)}, 1),
        File({g_aac, Raw(0), Audio(23, {SOUND_AAC, 2, 7}), g_aac, Raw(46)}, 4),
        File({Audio(0, AudioData(SOUND_MP3, Mp3Frame())), Screen(0), Screen(20, 0), Audio(26, {SOUND_MP3, 1}),
              Screen(40)}),
        File({Audio(0, AudioData(SOUND_SPEEX, Noise(42))), Video(0, VideoData(1, 9, Noise(70))), Video(9, {0x29, 4})}),
        // Too short for their codec bytes.
        File({g_avc, g_aac, Raw(0), Video(10, {0x27, 1, 0, 0}), Audio(12, {SOUND_AAC}), Video(15, {0x27}), Raw(20),
              Video(21, {0x27, 1, 0, 0, 0}), Audio(22, {SOUND_AAC, 1}), Nalu(40), Raw(46)}),
        File({g_avc, Nalu(0, LARGE), Nalu(40, GROWN), Nalu(80, LARGE), Nalu(120)}, 1),
    };
    const OpenOptions modes[] = {{},         Cache(SMALL),        Buffer(1u << 20), {GROWING}, Cache(SMALL, GROWING),
                                 {SEPARATE}, {SEPARATE | GROWING}};
    for (const Flv& flv : files) {
        for (const OpenOptions& mode : modes) {
            SCOPED_TRACE(std::to_string(&flv - files) + " with mode " + std::to_string(&mode - modes));
            FakeHost host(flv.bytes);
            Session session(host, mode);
            for (const uint32_t stream : Streams(mode.options)) {
                int32_t rc = 0;
                EXPECT_EQ(play(session, stream, &rc), flv.frames(stream));
                EXPECT_EQ(rc, (session.ctx()->streams & stream) != 0 ? -2 : -1);
            }
        }
    }
}

TEST(Delivery, ContinuesAfterAFailure)
{
    const Bytes last_turn = Repeat(BUDGET - 1, g_avc, {Damaged(Nalu(0, 5000)), Nalu(0), Nalu(40)}, 1).bytes;
    // The second request seeks past a configuration, and then by the size of a tag in the damage.
    const Bytes damage = Concat({File({g_avc, Nalu(0), {9, 9, AvcConfig(Noise(5000))}}).bytes, Bytes(3u << 20)});
    const Bytes screen = File({Screen(0), Screen(40), Screen(80)}, 1).bytes;
    const Bytes large = File({g_avc, Nalu(0), Nalu(40, 5000), Nalu(80)}, 1).bytes;
    const Bytes other = File(Tags{Screen(0)} + Tags(4100, Pcm(9)) + Tags{Screen(5000)}).bytes;
    constexpr HostFn TELL = HostFn::Tell, SEEK = HostFn::Seek;
    const OpenOptions grows = {GROWING}, two = {GROWING | SEPARATE}, small = Buffer(1000, GROWING);
    // Tags with a wrong back-pointer, in two runs separated by a configuration packet, which starts a new turn: in all
    // turns of a request together, 16384 checks may fail.
    constexpr size_t CHECKS = 16384;
    const auto bad = [](size_t first, size_t second) {
        const Tag tag = Damaged(Raw(0, 3));
        const Tags runs = Tags(first, tag) + Tags{g_aac} + Tags(second, tag);
        return File(Tags{g_meta, g_aac, Raw(0)} + runs + Tags{Raw(40), Raw(80)}, 4).bytes;
    };
    const Row rows[] = {
        {.what = "wrong back-pointer in the last turn", .file = last_turn, .time = 0},
        {.what = "seek past damage", .file = damage, .open = grows, .site = FRAME_END, .fault = {SEEK, 2}},
        {.what = "and back", .file = damage, .open = grows, .site = BACK_FROM_SKIP, .fault = {SEEK, 2, true}},
        // Continues by the size of its last tag, 0 so far: 15 bytes later it is inside the frame at 40 ms.
        {.what = "position of the tag", .file = screen, .open = grows, .fault = {TELL, 2}, .time = 80},
        // Four bytes are left where the reader stands, so it continues after them.
        {.what = "past frame", .file = large, .open = small, .site = VIDEO_NO_ROOM, .fault = {SEEK, 1}, .time = 80},
        {.what = "position", .file = other, .open = two, .site = FRAME_POSITION, .fault = {TELL, 1}, .time = 5000},
        {.what = "position before the search", .file = other, .open = two, .fault = {TELL, 2}, .time = 5000},
        {.what = "position after 4096 tags", .file = other, .open = two, .fault = {TELL, 3}, .time = 5000},
        {.what = "failed checks", .file = bad(0, CHECKS - 1), .time = 40},
        {.what = "in two runs", .file = bad(8000, CHECKS - 8001), .time = 40},
        {.what = "one more check", .file = bad(8000, CHECKS - 8000), .site = FRAME_END, .time = 40},
    };
    for (Row row : rows) {
        row.before = row.file == last_turn ? 0 : 1;
        row.stream = VIDEO; // ignored unless there are two readers
        Expect(row, Op::Frame);
    }
}

// Frames larger than the cache, and false headers that claim such frames.

// A frame of 50,000 bytes: what is cached of it, the rest in one read, and a refill that starts with its back-pointer.
// If that read is short, the back-pointer is still checked: the tag is recorded as cut short, and the next one is
// delivered.
TEST(LargeFrames, AreReadInOrder)
{
    constexpr size_t BIG = 50000;
    const auto two = [](const Tags& config, const auto& frame) {
        return config + Tags{frame(0, BIG), frame(40, BIG), frame(80, 60), frame(90, 60)};
    };
    const struct {
        Tags tags;
        const char* log; // 4096 bytes are cached: 4 of a back-pointer, 11 of a tag header, 5, 2 or 1 of a codec header
        Site cut;        // recorded when the read is short
        OpenOptions open = {};
    } rows[] = {
        {.tags = two({g_avc}, Nalu), .log = "copy(4076)= read(45924)=45924 read(4096)=164", .cut = VIDEO_CUT},
        {.tags = two({g_aac}, Raw), .log = "copy(4079)= read(45921)=45921 read(4096)=158", .cut = AAC_CUT},
        {.tags = two({}, Pcm),
         .log = "copy(4080)= read(45920)=45920 read(4096)=156",
         .cut = AUDIO_CUT,
         .open = Buffer(BIG)},
    };
    const std::regex query("tell64\\(\\)=\\d+ ");
    for (const auto& row : rows)
        for (const uint32_t bytes : {UINT32_MAX, 0u, 100u}) { // most bytes that the read of the rest returns
            SCOPED_TRACE(testing::PrintToString(std::pair(&row - rows, bytes)));
            const bool whole = bytes == UINT32_MAX;
            const uint32_t stream = row.tags[0].stream();
            const Flv flv = File(row.tags, stream == VIDEO ? 1 : 4);
            FakeHost host(flv.bytes);
            Session session(host, row.open);
            ASSERT_EQ(session.frame(stream).rc, 0);
            host.reset_calls();
            host.start_log(true);
            host.shorten_nth(HostFn::Read, 1, bytes);
            EXPECT_EQ(session.frame(stream).frame, flv.frames()[whole ? 1 : 2]);
            EXPECT_TRUE(session.recorded(whole ? std::nullopt : std::optional(row.cut))) << session.error_line();
            const std::string log = std::regex_replace(host.take_log(), query, "");
            EXPECT_TRUE(!whole || (log == row.log && host.calls(HostFn::Tell) <= 2)) << log;
        }
}

// Only a frame larger than the buffer is checked first, with two seeks. The buffer grows to multiples of 16,384.
TEST(LargeFrames, AreCheckedFirstWhenTheBufferHasToGrow)
{
    const auto expect = [](size_t size, uint64_t seeks, uint32_t buffer) {
        FakeHost host(File({g_avc, Nalu(0), Nalu(40, size)}, 1).bytes);
        Session session(host);
        ASSERT_EQ(session.frame().rc, 0);
        host.reset_calls();
        EXPECT_EQ(session.frame().frame.data, Noise(size));
        EXPECT_EQ(host.calls(HostFn::Seek), seeks) << size;
        EXPECT_EQ(session.ctx()->frame_buffer_size, buffer) << size;
    };
    expect(512000, 0, 512000);
    expect(512001, 2, 524288);
    expect(524288, 2, 524288);
    expect(524289, 2, 540672);
}

TEST(LargeFrames, WithAWrongBackPointerAreTheOnlyOnesSkipped)
{
    const Tag bad = Damaged(Nalu(40, 6000)), last = Damaged(Nalu(100, 9000));
    FakeHost host(File({g_avc, Nalu(0, 5000), bad, Nalu(80, 7000), Nalu(120, 8000), last}, 1).bytes);
    Session session(host);
    for (const auto& [time, size] : {std::pair(0u, 5000u), {80, 7000}, {120, 8000}, {0, 8000}}) {
        const FrameResult got = session.frame();
        EXPECT_EQ(got.frame.timestamp, time);
        EXPECT_EQ(session.ctx()->last_frame_size, size);
        EXPECT_EQ(session.last_error(), got.rc == 0 ? 0 : -10002); // a copy that was rejected is not recorded
    }
}

// False headers in damaged data that claim half a MiB, or more than is left: all in one turn of a request, or each in
// its own turn, after a configuration packet.
TEST(LargeFrames, CostAtMostOnePayloadWhenTheyAreFalse)
{
    constexpr uint64_t CACHE = 4096, HEADERS = 50, FRAME = 10000;
    const uint64_t crossed =
        HEADERS * (200 + 2 * CACHE + 16) + FRAME + 4 * CACHE; // each header, and the frame after them
    const Tags bad = {Damaged(Nalu(20))};                     // a check that fails before the false headers
    const struct {
        const char* what;
        uint32_t claim;
        uint64_t most; // bytes read
        bool turns = false;
        Tags before = {};
    } rows[] = {
        {.what = "half a MiB", .claim = 500000, .most = crossed + 500000},
        {.what = "in turns", .claim = 500000, .most = crossed + 500000, .turns = true},
        {.what = "after a failed check", .claim = 500000, .most = crossed, .before = bad},
        {.what = "larger than the buffer", .claim = 600000, .most = crossed},
        {.what = "more than is left", .claim = 750000, .most = crossed + 711000},
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(row.what);
        Tags tags = Tags{g_avc, Nalu(0, 100000)} + row.before;
        for (uint64_t i = 0; i < HEADERS; ++i) {
            if (row.turns)
                tags.push_back(g_avc);
            tags.push_back({9, 40, AvcNalu(true, Noise(100)), 0xEEEEEEEE, row.claim});
        }
        for (uint32_t i = 0; i < 70; ++i)
            tags.push_back(Nalu(80 + i, FRAME));
        FakeHost host(File(tags, 1).bytes);
        Session session(host, row.claim > 700000 ? Buffer(800000) : OpenOptions{});
        ASSERT_EQ(session.frame().rc, 0);
        host.reset_calls();
        EXPECT_EQ(session.frame().frame.timestamp, 80u);
        EXPECT_LE(host.bytes_read(), row.most);
        EXPECT_EQ(host.calls(HostFn::Alloc), 0u); // the buffer does not grow
        EXPECT_EQ(session.last_error(), 0);
    }
}

} // namespace
