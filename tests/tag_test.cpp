// Tag navigation: which headers are plausible, how searches cross damage, which host calls a step costs, and where the
// valid data of a file ends.

#include "support/report.h"
#include "support/session.h"

using namespace flvd_test;

namespace {

static_assert(VIDEO == FLVD_TAG_VIDEO && AUDIO == FLVD_TAG_AUDIO);
constexpr uint32_t SCRIPT = FLVD_TAG_SCRIPT, CONFIG = FLVD_TAG_CONFIG;
constexpr uint32_t KEY = VIDEO | FLVD_TAG_KEYFRAME, ANY = VIDEO | AUDIO | SCRIPT;
constexpr int32_t NOT_FOUND = FLVD_ERR_NOT_FOUND, ENDED = FLVD_ERR_END_OF_DATA;
constexpr int64_t DATA_OFFSET = 9, FIRST_TAG = 13;
constexpr uint32_t CACHE = 4096;
constexpr int64_t MIB = 0x100000;                        // the range of a resynchronisation
constexpr int64_t WINDOW = CACHE - 12;                   // possible starts of a tag per cache
constexpr int64_t SCANNED = (MIB / WINDOW + 1) * WINDOW; // bytes that a failed scan has examined

using Found = std::tuple<int32_t, int64_t, uint32_t>; // result; position and kind on success

// A reader on some bytes, with an instance that has no information about the streams.
struct Reader {
    FakeHost host;
    flvd_ctx_t ctx{};
    fio_file_t* file;
    int64_t end;
    flvd_tag_info_t info{};
    uint32_t kind = 0;

    explicit Reader(const Bytes& bytes, uint32_t cache = CACHE, uint32_t read_size = 0)
        : host(bytes), file(host.open_reader({cache}))
    {
        __FLV_DMX__fioSetCacheReadSize(file, read_size);
        ctx.cache_size = cache;
        ctx.data_offset = static_cast<int32_t>(DATA_OFFSET);
        ctx.data_end = end = static_cast<int64_t>(bytes.size());
        ctx.video_codec_filter = ctx.audio_format_filter = 0xFFFF;
    }
    ~Reader() { __FLV_DMX__fioClose(file); }

    Reader& at(int64_t pos)
    {
        host.fail_nothing();
        EXPECT_EQ(__FLV_DMX__fioSeek64(file, pos, FIO_SEEK_SET), 0);
        host.reset_calls();
        return *this;
    }
    Found verify(uint32_t wanted) { return found(FLVD_GetCurrTagInfo(&ctx, file, &info, wanted, 1)); }
    Found trust(uint32_t wanted) { return found(FLVD_GetCurrTagInfo(&ctx, file, &info, wanted, 0)); }
    Found next(uint32_t wanted) { return found(FLVD_MoveToNextTag(&ctx, file, &info, wanted, &kind)); }
    Found prev(uint32_t wanted) { return found(FLVD_MoveToPrevTag(&ctx, file, &info, wanted, &kind)); }
    int64_t find(int64_t limit = MIB) { return FLVD_FindNextTag(&ctx, file, static_cast<uint32_t>(limit)); }

    Found found(int32_t rc) { return {rc, rc == 0 ? __FLV_DMX__fioTell64(file) : 0, std::exchange(kind, 0)}; }
};
using Step = Found (Reader::*)(uint32_t wanted);

const auto AudioTag = [](size_t size = 100) { return Raw(5, size - 2); };
const auto VideoTag = [](size_t size = 100) { return Nalu(5, size - 5); };
const auto Zeros = [](int64_t count) { return Bytes(static_cast<size_t>(count)); };
Bytes operator+(const Bytes& front, const Tag& tag)
{
    return Concat({front, File({tag}).body()});
}

// A header with values at the limits, and whether it is found by a search that starts at it, by one that scans for it,
// and by one that goes backward.
TEST(TagHeaders, ArePlausibleUpToTheirBounds)
{
    constexpr uint32_t ANY_CODEC = 0xFFFF, NONE = 0, STANDING = 1, SCANNING = 2, BACKWARD = 4, ALL = 7;
    const Bytes avc6 = {0x67, 1, 0, 0, 0}, last5 = {0x5F, 0}, first6 = {0x60, 0};
    const struct {
        const char* what;
        uint32_t taken; // searches that find it
        Bytes data = {0x17, 1, 0, 0, 0};
        uint32_t timestamp = 5000;
        uint32_t last_ts = 0; // 0: unknown
        int64_t data_end = 1000;
        uint32_t video = ANY_CODEC, audio = ANY_CODEC; // filters
        uint8_t type = 9;
    } rows[] = {
        {.what = "at the last time", .taken = STANDING | BACKWARD, .last_ts = 5000},
        {.what = "before it", .taken = ALL, .last_ts = 5001},
        {.what = "after the last time", .taken = NONE, .last_ts = 4999},
        {.what = "no time known", .taken = ALL, .timestamp = UINT32_MAX - 1},
        {.what = "the largest time", .taken = STANDING | BACKWARD, .timestamp = UINT32_MAX},
        {.what = "as large as all data", .taken = BACKWARD, .data_end = 5},
        {.what = "one byte less", .taken = ALL, .data_end = 6},
        {.what = "frame type 6, no filter", .taken = ALL, .data = avc6},
        {.what = "frame type 5, codec 15", .taken = ALL, .data = last5, .video = 15},
        {.what = "frame type 6, codec 0", .taken = NONE, .data = first6, .video = 0},
        {.what = "filter of another frame type", .taken = ALL, .video = 0x37},
        {.what = "filter of another codec", .taken = NONE, .video = 6},
        {.what = "audio", .taken = ALL, .audio = 0x17, .type = 8},
        {.what = "audio, filter of another rate", .taken = NONE, .audio = 0x13, .type = 8},
        {.what = "tag type 10", .taken = NONE, .type = 10},
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(row.what);
        Reader r(Zeros(FIRST_TAG) + Tag{row.type, row.timestamp, row.data});
        std::tie(r.ctx.last_ts, r.ctx.data_end) = std::tie(row.last_ts, row.data_end);
        std::tie(r.ctx.video_codec_filter, r.ctx.audio_format_filter) = std::tie(row.video, row.audio);
        EXPECT_EQ(std::get<0>(r.at(FIRST_TAG).trust(ANY)), (row.taken & STANDING) != 0 ? 0 : ENDED);
        EXPECT_EQ(r.at(FIRST_TAG).find(), (row.taken & SCANNING) != 0 ? 0 : NOT_FOUND);
        EXPECT_EQ(std::get<0>(r.at(r.end).prev(ANY)), (row.taken & BACKWARD) != 0 ? 0 : FLVD_ERR_AT_FIRST_TAG);
    }
}

// Many muxers write a wrong back-pointer after the first script tag, which may start up to four bytes after DataOffset.
TEST(TagHeaders, OfTheFirstScriptTagNeedNoBackPointer)
{
    const auto expect = [](const Tag& tag, int64_t at, const Found& found) {
        Reader r(Concat({Zeros(at) + tag, Zeros(6000)}));
        r.ctx.data_end = 10000;
        EXPECT_EQ(r.at(at).verify(ANY), found) << tag.size() << " bytes at " << at;
    };
    expect({18, 0, Noise(100), 7}, FIRST_TAG, {0, FIRST_TAG, 0});
    expect({18, 0, Noise(5000), 7}, FIRST_TAG, {0, FIRST_TAG, 0});
    expect({18, 0, Noise(100), 7}, FIRST_TAG + 1, {ENDED, 0, 0});
    expect({9, 0, AvcNalu(true, Noise(100)), 7}, FIRST_TAG, {ENDED, 0, 0});
}

// The kind reported depends on the requested kinds and on the direction.
TEST(TagKinds, AreReportedInBothDirections)
{
    constexpr uint32_t s = SCRIPT, v = VIDEO, a = AUDIO, k = KEY;
    constexpr uint32_t vc = VIDEO | CONFIG, kc = KEY | CONFIG, ac = AUDIO | CONFIG;
    struct Kinds {
        uint32_t next = 0, previous = 0; // 0: the tag is skipped
    };
    struct Row {
        const char* what;
        Tag tag;
        Kinds any = {}, config = {}, keyframe = {}; // if all tags, configurations, or keyframes are requested
    };
    const Row rows[] = {
        {.what = "script data", .tag = g_meta, .any = {s, s}},
        {.what = "AVC configuration", .tag = g_avc, .any = {kc, v}, .config = {vc, vc}, .keyframe = {k, k}},
        {.what = "AAC configuration", .tag = g_aac, .any = {ac, a}, .config = {ac, ac}, .keyframe = {ac, ac}},
        {.what = "AVC keyframe", .tag = VideoTag(), .any = {k, v}, .keyframe = {k, k}},
        {.what = "AVC inter frame", .tag = {9, 1, AvcNalu(false, Noise(60))}, .any = {v, v}},
        {.what = "AAC frame", .tag = AudioTag(), .any = {a, a}},
        {.what = "configuration as inter frame", .tag = {9, 2, {0x27, 0, 0}}, .any = {vc, v}, .config = {vc, vc}},
        {.what = "generated keyframe", .tag = {9, 3, {0x47, 1, 0}}, .any = {k, v}, .keyframe = {k, k}},
        {.what = "H.263 keyframe", .tag = {9, 4, {0x12, 5}}, .any = {kc, v}, .config = {kc, v}, .keyframe = {k, k}},
        {.what = "H.263 inter frame", .tag = {9, 5, {0x22, 5}}, .any = {vc, v}, .config = {vc, v}},
        {.what = "MP3", .tag = {8, 6, {SOUND_MP3, 5}}, .any = {ac, a}, .config = {ac, a}, .keyframe = {ac, a}},
        {.what = "AVC end of sequence", .tag = {9, 7, g_avc_end}, .any = {k, v}, .keyframe = {k, k}},
        {.what = "script data at the end", .tag = g_meta, .any = {s, s}},
    };
    Tags tags;
    for (const Row& row : rows)
        tags.push_back(row.tag);
    const Flv flv = File(tags);
    for (const auto& [wanted, column] :
         {std::pair(ANY, &Row::any), {vc | ac, &Row::config}, {kc | AUDIO, &Row::keyframe}}) {
        Reader r(flv.bytes);
        r.at(DATA_OFFSET);
        const auto expect = [&, all = wanted](Step step, size_t i, uint32_t kind) {
            EXPECT_TRUE(kind == 0 || (r.*step)(all) == Found(0, flv.tags[i].offset, kind)) << rows[i].what;
        };
        for (size_t i = 0; i < tags.size(); ++i)
            expect(&Reader::next, i, (rows[i].*column).next);
        EXPECT_EQ(r.next(wanted), Found(ENDED, 0, 0));
        r.at(r.end);
        for (size_t i = tags.size(); i-- > 0;)
            expect(&Reader::prev, i, (rows[i].*column).previous);
        EXPECT_EQ(r.prev(wanted), Found(FLVD_ERR_AT_FIRST_TAG, 0, 0));
    }
}

TEST(FindNextTag, CountsTheBytesToTheNextCandidate)
{
    const auto find = [](int64_t distance, int64_t limit) {
        SCOPED_TRACE(testing::PrintToString(std::pair(distance, limit)));
        const bool covered = distance < (limit + WINDOW - 1) / WINDOW * WINDOW; // whole windows are examined
        Reader r(Zeros(100 + distance) + AudioTag(), CACHE, 16);
        EXPECT_EQ(r.at(100).find(limit), covered ? distance : NOT_FOUND);
        EXPECT_EQ(__FLV_DMX__fioGetCacheReadSize(r.file), 16u);
        const auto reads = static_cast<int64_t>(r.host.calls(HostFn::Read));
        EXPECT_TRUE(!covered || (reads == distance / WINDOW + 1 && __FLV_DMX__fioTell64(r.file) == 100 + distance));
    };
    for (const int64_t distance : {int64_t{0}, int64_t{1}, WINDOW - 1, WINDOW, SCANNED - 1, SCANNED})
        for (const int64_t limit : {int64_t{0}, int64_t{1}, WINDOW, WINDOW + 1, MIB})
            find(distance, limit);
    EXPECT_EQ(Reader(Bytes() + AudioTag(), 12).at(0).find(), NOT_FOUND); // the cache is too small for a header
}

// An audio tag of 20 bytes with a plausible header and a wrong back-pointer; and many of them.
const Tag BAD{8, 0, Bytes{0xAF, 1, 0xEE, 0xEE, 0xEE}, 0xEEEEEEEE};
constexpr int64_t BAD_SIZE = 20, CHECKS = 16384; // CHECKS: may fail in one search
const auto Bad = [](int64_t count) { return File(std::vector(static_cast<size_t>(count), BAD)).body(); };

// From position 100 on: damage, then the requested tag, which each search either finds or fails to find with a result.
TEST(Resynchronisation, CoversOneMiBInTotal)
{
    const Bytes half = Zeros(MIB / 2 + 1000), two_gaps = Concat({half + AudioTag(), half});
    const Bytes failed = Concat({Bad(CHECKS), Zeros(30)});
    // With a failed check every 64 bytes, the whole MiB is still covered: a check does not reduce the range.
    const Bytes sparse = Concat(std::vector<Bytes>(MIB / 64 - 1, Concat({Bad(1), Zeros(64 - BAD_SIZE)})));
    // Nor does a check after which a scan finds nothing: a whole MiB is left.
    const Bytes gap = Concat({Bad(1), Zeros(1 + SCANNED - BAD_SIZE + MIB)});
    struct Results {
        int32_t verify = 0, next = 0, trust = 0;
    };
    constexpr Results none = {NOT_FOUND, NOT_FOUND, NOT_FOUND}, ended = {ENDED, ENDED, ENDED};
    constexpr Results spent = {NOT_FOUND, NOT_FOUND, 0};        // no checks are left; without verifying, none are made
    constexpr Results at_limit = {NOT_FOUND, ENDED, NOT_FOUND}; // a step checks the position where its budget ran out
    const struct {
        const char* what;
        Bytes damage;
        Results rc = {};      // 0: the tag is found
        bool tag = true;      // after the damage
        int64_t data_end = 0; // 0: of the file
        bool again = false;   // the next search continues and finds it
    } rows[] = {
        {.what = "one MiB", .damage = Zeros(MIB)},
        {.what = "one byte more", .damage = Zeros(MIB + 1), .rc = none},
        {.what = "the data ends within the range", .damage = Zeros(MIB / 2), .rc = ended, .tag = false},
        // No header can start in the last 12 bytes.
        {.what = "the data ends first", .damage = Zeros(MIB + 12), .rc = ended, .tag = false},
        {.what = "the limit comes first", .damage = Zeros(MIB + 13), .rc = at_limit, .tag = false},
        {.what = "near it", .damage = Zeros(2 * MIB), .rc = at_limit, .tag = false, .data_end = 101 + SCANNED + 12},
        {.what = "not near", .damage = Zeros(2 * MIB), .rc = none, .tag = false, .data_end = 101 + SCANNED + 13},
        {.what = "a valid tag restores the checking budget", .damage = two_gaps, .rc = {0, 0, NOT_FOUND}},
        {.what = "failed checks everywhere", .damage = sparse},
        {.what = "all checks but one fail", .damage = Bad(CHECKS - 1)},
        {.what = "all checks fail", .damage = Bad(CHECKS), .rc = spent},
        {.what = "one less than twice that", .damage = Bad(2 * CHECKS - 1), .rc = spent, .again = true},
        {.what = "then the data ends", .damage = failed, .rc = {NOT_FOUND, NOT_FOUND, ENDED}, .tag = false},
        {.what = "one byte after a bad tag", .damage = {8}, .rc = {0, 0, ENDED}, .data_end = MIB}, // of 0x090000 bytes
        {.what = "one MiB after a failed scan", .damage = gap, .rc = {0, 0, NOT_FOUND}},
        {.what = "one byte more after it", .damage = Concat({gap, {0}}), .rc = none},
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(row.what);
        const Bytes before = Concat({Zeros(100), row.damage});
        Reader r(row.tag ? before + VideoTag() : before);
        r.ctx.data_end = row.data_end != 0 ? row.data_end : r.end;
        const auto expect = [&](const Step step, int32_t rc) {
            Found found = (r.at(100).*step)(VIDEO);
            EXPECT_EQ(std::get<0>(found), rc);
            if (rc != 0 && row.again)
                found = (r.*step)(VIDEO);
            const bool there = rc == 0 || row.again;
            EXPECT_EQ(std::get<1>(found), there ? static_cast<int64_t>(before.size()) : 0);
        };
        expect(&Reader::verify, row.rc.verify);
        expect(&Reader::next, row.rc.next);
        expect(&Reader::trust, row.rc.trust);
    }
}

// A position query that returns a wrong position, or a seek that fails and is not retried.
TEST(Position, ThatDoesNotAdvanceEndsASearch)
{
    // Video of 65 bytes and 15 more, audio of 115 bytes in total, video; the first tag starts at FIRST_TAG. Or audio
    // that does not fit the cache, and video.
    const Bytes small = Zeros(FIRST_TAG) + VideoTag(65) + AudioTag() + VideoTag();
    const Bytes large = Zeros(FIRST_TAG) + AudioTag(5000) + VideoTag();
    const int64_t audio = FIRST_TAG + 80, last = audio + 115;
    const Step describe = &Reader::verify, trust = &Reader::trust, next = &Reader::next, prev = &Reader::prev;
    const struct {
        const char* what;
        Step step;
        int64_t from;
        uint64_t nth;      // position query, or seek
        int64_t error = 0; // of the position; 0: the seek fails
        Found found = {NOT_FOUND, 0, 0};
        uint32_t wanted = VIDEO;
    } rows[] = {
        {.what = "before the search", .step = describe, .from = audio, .nth = 2, .error = -1},
        {.what = "after a tag: its start", .step = describe, .from = audio, .nth = 3, .error = -115},
        {.what = "a byte later", .step = describe, .from = audio, .nth = 3, .error = -114, .found = {0, last, 0}},
        {.what = "its start, stepping", .step = next, .from = audio, .nth = 3, .error = -115},
        {.what = "later, stepping", .step = next, .from = audio, .nth = 3, .error = -114, .found = {0, last, KEY}},
        {.what = "before a tag: its end", .step = prev, .from = last, .nth = 2, .error = 115},
        {.what = "a byte back", .step = prev, .from = last, .nth = 2, .error = 114, .found = {0, FIRST_TAG, VIDEO}},
        {.what = "none before a tag", .step = prev, .from = last, .nth = 2, .error = -last},
        {.what = "no seek back to a tag", .step = describe, .from = FIRST_TAG, .nth = 2, .wanted = AUDIO},
        {.what = "stepping", .step = next, .from = DATA_OFFSET, .nth = 3, .wanted = AUDIO},
        {.what = "no seek past it", .step = trust, .from = FIRST_TAG, .nth = 1, .found = {ENDED, 0, 0}},
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(row.what);
        Reader r(row.error != 0 ? small : large);
        r.at(row.from);
        r.host.on_tell = [&](int64_t position) {
            return r.host.calls(HostFn::Tell) == row.nth ? position + row.error : position;
        };
        r.host.fail_nth(HostFn::Seek, row.error != 0 ? 0 : row.nth);
        EXPECT_EQ((r.*row.step)(row.wanted), row.found);
        EXPECT_TRUE(row.error != 0 || r.host.calls(HostFn::Seek) == row.nth);
    }
}

TEST(PrevTag, DoesNotExistBeforeTheFirst)
{
    Reader r(Bytes() + AudioTag()); // a back-pointer to the start of the file does not point to a tag
    for (const int64_t from : {DATA_OFFSET, r.end}) {
        EXPECT_EQ(r.at(from).prev(ANY), Found(FLVD_ERR_AT_FIRST_TAG, 0, 0));
        EXPECT_EQ(__FLV_DMX__fioTell64(r.file), DATA_OFFSET);
    }
}

TEST(PrevTag, GoesBackOneMiBInTotal)
{
    Reader twice(Concat({Zeros(FIRST_TAG) + AudioTag(), Zeros(MIB - 1) + VideoTag(), {0}}), CACHE, 16);
    EXPECT_EQ(twice.at(twice.end).prev(AUDIO), Found(0, FIRST_TAG, AUDIO)); // the valid tag restores the budget
    Reader just(Zeros(DATA_OFFSET + MIB + 4), CACHE, 16);
    EXPECT_EQ(just.at(just.end).prev(ANY), Found(FLVD_ERR_AT_FIRST_TAG, 0, 0));
    Reader spent(Concat({Zeros(FIRST_TAG) + AudioTag(), Zeros(MIB)}), CACHE, 16);
    EXPECT_EQ(spent.at(spent.end).prev(ANY), Found(NOT_FOUND, 0, 0));
}

TEST(HostCalls, OfTheBackPointerCheck)
{
    const std::string begin = "tell64()=13 eof()=0 read(",
                      cache = begin + "4096)=", whole = cache + "4096 tell64()=4109";
    const std::string back = " seek64(13,0)=0"; // to the tag
    const std::string cut = cache + "50 tell64()=63 read(4046)=50 read(3996)=50" + back;
    const std::string narrow = begin + "16)=16 tell64()=29 seek64(95,1)=0 read(16)=16" + back;
    const struct {
        const char* what;
        size_t size;
        std::string log;                      // its start; no seek follows
        uint32_t read_size = 0, most = CACHE; // of each read
    } rows[] = {
        {.what = "as large as the cache", .size = 4081, .log = whole},
        {.what = "one byte larger", .size = 4082, .log = whole + " read(1)=1" + back},
        {.what = "larger", .size = 5000, .log = whole + " seek64(915,1)=0 read(4)=4" + back},
        {.what = "in short reads", .size = 100, .log = cut, .most = 50},
        {.what = "narrow reads", .size = 100, .log = narrow, .read_size = 16},
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(row.what);
        Reader r(Zeros(FIRST_TAG) + AudioTag(row.size) + VideoTag(), CACHE, row.read_size);
        r.at(FIRST_TAG).host.limit_reads(row.most);
        r.host.start_log();
        EXPECT_EQ(FLVD_GetCurrTagInfo(&r.ctx, r.file, &r.info, AUDIO, 1), 0);
        const std::string calls = r.host.take_log();
        EXPECT_EQ(calls.substr(0, row.log.size()), row.log);
        EXPECT_EQ(calls.find("seek", row.log.size()), std::string::npos);
        EXPECT_EQ(__FLV_DMX__fioGetCacheReadSize(r.file), row.read_size != 0 ? row.read_size : CACHE);
    }
}

// What an open finds.
struct Extent {
    int64_t end; // of the valid data
    uint32_t last_ts;
    uint32_t method = FLVD_SEEK_BY_SCAN;
    uint32_t entries = 0, last_key_ms = 0; // of the keyframe index
};
void ExpectExtent(const char* what, const Bytes& file, const OpenOptions& open, const Extent& expected)
{
    SCOPED_TRACE(what);
    FakeHost host(file);
    Session session(host, open);
    ASSERT_TRUE(session.opened());
    const flvd_ctx_t& ctx = *session.ctx();
    EXPECT_EQ(ctx.data_end, expected.end);
    EXPECT_EQ(ctx.last_ts, expected.last_ts);
    EXPECT_EQ(ctx.seek_method, expected.method);
    EXPECT_EQ(ctx.keyframe_index.entry_count, expected.entries);
    EXPECT_EQ(ctx.last_keyframe_ms, expected.last_key_ms);
    EXPECT_EQ(ctx.video_info.last_key_time_ms, expected.last_key_ms);
}

// Video every 40 ms, every second frame a keyframe, audio up to 782 ms.
const ChainOptions CHAIN = {true, true, false, false, 20, 2};
const auto Indexed = [](const IndexHook& hook) { return MakeChain({true, true, true, true, 20, 2, 0, hook}); };

TEST(Extent, EndsWithTheLastTag)
{
    const OpenOptions QUICK{0, true};
    const Flv flv = MakeChain(CHAIN);
    const auto with = [&flv](const Bytes& more) { return Concat({flv.bytes, more}); };
    const Bytes half = File(std::vector(20, AudioTag(100000)), 4).bytes + AudioTag();
    const int64_t end = flv.size(), half_end = static_cast<int64_t>(half.size());
    ExpectExtent("nothing after the tags", flv.bytes, {}, {.end = end, .last_ts = 782});
    ExpectExtent("100 bytes after them", with(Bytes(100, 0xEE)), {}, {.end = end, .last_ts = 782});
    ExpectExtent("3 MiB of bad tags", with(Bad(3 * MIB / BAD_SIZE)), {}, {.end = end, .last_ts = 782});
    ExpectExtent("zeros in the second half", Concat({half, Zeros(3 * MIB)}), {}, {.end = half_end, .last_ts = 5});
    // The signature and version of the file header look like a tag size that the last four bytes agree with.
    const Bytes far = Concat({Zeros(0x4C5601 + 11 - end), {0, 0x4C, 0x56, 0x0C}});
    ExpectExtent("a back-pointer to the start of the file", with(far), {}, {.end = end, .last_ts = 782});
    // Opened for information.
    ExpectExtent("15 bytes", with(Bytes(15, 0xEE)), QUICK, {.end = end, .last_ts = 782, .method = FLVD_SEEK_NONE});
    ExpectExtent("16 bytes", with(Bytes(16, 0xEE)), QUICK, {.end = end + 16, .last_ts = 0, .method = FLVD_SEEK_NONE});
    for (uint64_t nth = 255; nth < 275; ++nth) { // a seek in the search for the last tag
        FakeHost host(with(Zeros(3 * MIB)));
        host.fail_nth(HostFn::Seek, nth);
        Session session(host);
        EXPECT_TRUE(session.failed_as_listed(Op::Open, session.open_rc())) << nth;
    }
}

TEST(Extent, UsesTheLargestTimeOfTheLastTags)
{
    const auto expect = [](const char* what, Tags tags, uint32_t audio, uint32_t last_ts) {
        for (uint32_t i = 0; i < audio; ++i)
            tags.push_back(Pcm(900 - i));
        const Flv flv = File(tags);
        ExpectExtent(what, flv.bytes, {}, {.end = flv.size(), .last_ts = last_ts});
    };
    const Tag inter{9, 1700, VideoData(2, CODEC_SCREEN, Noise(50))};
    expect("audio is later", {Screen(0), Screen(700)}, 1, 900);
    expect("video is later, the tenth tag from the end", {Screen(0), inter}, 9, 1700);
    expect("the eleventh", {Screen(0), inter}, 10, 900);
    expect("audio only: the last tag counts", {}, 2, 899);
}

TEST(Extent, TrimsAKeyframeIndexToTheData)
{
    const Flv flv = Indexed({});
    const auto cut = [&flv](size_t tag) {
        return Bytes(flv.bytes.data(), flv.bytes.data() + flv.tags[tag].offset + 20);
    };
    const Bytes negative =
        Indexed([](auto&, auto& at) { at.back() = -5; }).bytes; // does not matter: no entry is past the end
    const Bytes astray =
        Indexed([&](auto&, auto& at) { at[3] = static_cast<double>(flv.size()) + 24, at[4] = 1e12; }).bytes;
    const Bytes fewer = Concat({Indexed([](auto& times, auto&) { times.resize(3); }).bytes, Bytes(100, 0xEE)});
    // Neither the last position in the file nor the bytes after its tags contain a tag.
    const Bytes no_step = Concat({astray, Bytes(20, 0xEE), {0, 0, 0, 7, 0xEE}});
    for (const OpenOptions& open : {OpenOptions{INDEX}, OpenOptions{}}) {
        SCOPED_TRACE(open.options);
        const auto expect = [&](const char* what, const Bytes& file, int64_t end, uint32_t last_ts, uint32_t entries,
                                uint32_t last_key) {
            ExpectExtent(what, file, open, {end, last_ts, FLVD_SEEK_BY_INDEX, entries, last_key});
        };
        expect("whole", flv.bytes, flv.size(), 782, 10, 720);
        expect("the last entry before the file", negative, flv.size(), 782, 10, 720);
        // One entry past the end stays.
        expect("cut in a frame", cut(34), flv.tags[34].offset, 437, 7, 480);
        expect("cut in a keyframe", cut(31), flv.tags[31].offset, 391, 6, 400);
        // Seven times fewer, of nine bytes each.
        expect("fewer times than positions", fewer, flv.size() - 63, 782, 3, 160);
        expect("entries past the end", no_step, flv.size(), 782, 4, 240);
    }
}

} // namespace
