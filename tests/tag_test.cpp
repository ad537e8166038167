// Tag navigation: which headers count, how damage is crossed, what a step costs the host, and where the valid data of
// an opened file ends.

#include "support/report.h"
#include "support/session.h"

#include <array>

using namespace flvd_test;

namespace {

static_assert(VIDEO == FLVD_TAG_VIDEO && AUDIO == FLVD_TAG_AUDIO);
constexpr uint32_t SCRIPT = FLVD_TAG_SCRIPT, CONFIG = FLVD_TAG_CONFIG;
constexpr uint32_t KEY = VIDEO | FLVD_TAG_KEYFRAME, ANY = VIDEO | AUDIO | SCRIPT;
constexpr int32_t NOT_FOUND = FLVD_ERR_NOT_FOUND, ENDED = FLVD_ERR_END_OF_DATA;
constexpr int64_t DATA_OFFSET = 9, FIRST_TAG = 13;
constexpr uint32_t CACHE = 4096;
constexpr int64_t MIB = 0x100000;                        // what resynchronisation covers
constexpr int64_t WINDOW = CACHE - 12;                   // candidate starts in a cache
constexpr int64_t SCANNED = (MIB / WINDOW + 1) * WINDOW; // what a failed scan has looked at

using Found = std::tuple<int32_t, int64_t, uint32_t>; // result, place and kind, the latter two on success alone

// A host that may tell one position wrong.
class Liar : public FakeHost {
public:
    using FakeHost::FakeHost;
    uint64_t nth = 0;
    int64_t error = 0;

protected:
    int64_t tell(void* handle, bool wide) override
    {
        const int64_t position = FakeHost::tell(handle, wide);
        return calls(HostFn::Tell) == nth ? position + error : position;
    }
};

// A reader on some bytes, with an instance that knows nothing of its streams.
struct Reader {
    Liar host;
    flvd_ctx_t ctx{};
    fio_file_t* file;
    int64_t end;
    flvd_tag_info_t info{};
    uint32_t kind = 0;

    explicit Reader(const Bytes& bytes, uint32_t cache = CACHE, uint32_t quantum = 0)
        : host(bytes), file(host.open_reader({cache}))
    {
        __FLV_DMX__fioSetCacheReadSize(file, quantum);
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
constexpr Step FORWARD[] = {&Reader::verify, &Reader::trust, &Reader::next};

const auto Sound = [](size_t size = 100) { return Raw(5, size - 2); };
const auto Picture = [](size_t size = 100) { return Nalu(5, size - 5); };
const auto Zeros = [](int64_t count) { return Bytes(static_cast<size_t>(count)); };
Bytes operator+(const Bytes& front, const Tag& tag)
{
    return Concat({front, File({tag}).body()});
}

// A header at its bounds: taken by a search that stands on it, by one that scans for it, and on the way back.
TEST(TagHeaders, ArePlausibleUpToTheirBounds)
{
    constexpr uint32_t ANY_CODEC = 0xFFFF;
    struct Row {
        const char* what;
        bool described, scanned, stepped_back;
        Bytes data = {0x17, 1, 0, 0, 0};
        uint32_t timestamp = 5000;
        uint32_t last_ts = 0; // 0: not known
        int64_t data_end = 1000;
        uint32_t video = ANY_CODEC, audio = ANY_CODEC; // filters
        uint8_t type = 9;
    };
    const Bytes avc5 = {0x57, 1, 0, 0, 0}, avc6 = {0x67, 1, 0, 0, 0}, last5 = {0x5F, 0}, first6 = {0x60, 0};
    const Row rows[] = {
        {.what = "at the last time", .described = true, .scanned = false, .stepped_back = true, .last_ts = 5000},
        {.what = "before it", .described = true, .scanned = true, .stepped_back = true, .last_ts = 5001},
        {.what = "after it", .described = false, .scanned = false, .stepped_back = false, .last_ts = 4999},
        {.what = "no time known",
         .described = true,
         .scanned = true,
         .stepped_back = true,
         .timestamp = UINT32_MAX - 1},
        {.what = "the last of all", .described = true, .scanned = false, .stepped_back = true, .timestamp = UINT32_MAX},
        {.what = "size of all data", .described = false, .scanned = false, .stepped_back = true, .data_end = 5},
        {.what = "a byte less", .described = true, .scanned = true, .stepped_back = true, .data_end = 6},
        {.what = "type 5", .described = true, .scanned = true, .stepped_back = true, .data = avc5, .video = 7},
        {.what = "type 6", .described = false, .scanned = false, .stepped_back = false, .data = avc6, .video = 7},
        {.what = "type 6, any", .described = true, .scanned = true, .stepped_back = true, .data = avc6},
        {.what = "codec 15", .described = true, .scanned = true, .stepped_back = true, .data = last5, .video = 15},
        {.what = "type 6 of 0",
         .described = false,
         .scanned = false,
         .stepped_back = false,
         .data = first6,
         .video = 0},
        {.what = "low bits", .described = true, .scanned = true, .stepped_back = true, .video = 0x37},
        {.what = "codec", .described = false, .scanned = false, .stepped_back = false, .video = 6},
        {.what = "sound", .described = true, .scanned = true, .stepped_back = true, .audio = 0x17, .type = 8},
        {.what = "its rate", .described = false, .scanned = false, .stepped_back = false, .audio = 0x13, .type = 8},
        {.what = "type 10", .described = false, .scanned = false, .stepped_back = false, .type = 10},
    };
    for (const Row& row : rows) {
        SCOPED_TRACE(row.what);
        Reader r(Zeros(FIRST_TAG) + Tag{row.type, row.timestamp, row.data});
        std::tie(r.ctx.last_ts, r.ctx.data_end) = std::tie(row.last_ts, row.data_end);
        std::tie(r.ctx.video_codec_filter, r.ctx.audio_format_filter) = std::tie(row.video, row.audio);
        EXPECT_EQ(std::get<0>(r.at(FIRST_TAG).trust(ANY)), row.described ? 0 : ENDED);
        EXPECT_EQ(r.at(FIRST_TAG).find(), row.scanned ? 0 : NOT_FOUND);
        EXPECT_EQ(std::get<0>(r.at(r.end).prev(ANY)), row.stepped_back ? 0 : FLVD_ERR_AT_FIRST_TAG);
    }
}

// Many muxers write a wrong size after the first script tag. It may stand up to four bytes after DataOffset.
TEST(TagHeaders, OfTheFirstScriptTagNeedNoBackPointer)
{
    const struct {
        const char* what;
        Tag tag;
        int64_t at;
        bool taken;
    } rows[] = {
        {.what = "first tag", .tag = {18, 0, Noise(100), 7}, .at = FIRST_TAG, .taken = true},
        {.what = "before it", .tag = {18, 0, Noise(100), 7}, .at = FIRST_TAG - 1, .taken = true},
        {.what = "a byte after it", .tag = {18, 0, Noise(100), 7}, .at = FIRST_TAG + 1, .taken = false},
        {.what = "large", .tag = {18, 0, Noise(5000), 7}, .at = FIRST_TAG, .taken = true},
        {.what = "large, a byte after", .tag = {18, 0, Noise(5000), 7}, .at = FIRST_TAG + 1, .taken = false},
        {.what = "beyond the end", .tag = {18, 0, Noise(100), 7, 9000}, .at = FIRST_TAG, .taken = true},
        {.what = "picture", .tag = {9, 0, AvcNalu(true, Noise(100)), 7}, .at = FIRST_TAG, .taken = false},
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(row.what);
        Reader r(Concat({Zeros(row.at) + row.tag, Zeros(6000)}));
        r.ctx.data_end = 10000;
        const Found tag(row.taken ? 0 : ENDED, row.taken ? row.at : 0, 0);
        EXPECT_EQ(r.at(row.at).verify(ANY), tag);
    }
}

TEST(TagKinds, AreReportedInBothDirections)
{
    const Bytes script = Amf("1");
    FlvBuilder builder;
    builder.script(script).add(g_avc).add(g_aac).add(Picture()).video(1, AvcNalu(false, Noise(60))).add(Sound());
    builder.video(2, Concat({{0x27, 0, 0, 0, 0}, Noise(70)})); // a sequence header in an inter frame
    builder.video(3, Concat({{0x47, 1, 0, 0, 0}, Noise(80)})); // a generated keyframe
    builder.video(4, VideoData(1, CODEC_H263, Noise(90))).video(5, VideoData(2, CODEC_H263, Noise(40)));
    const Flv flv = builder.audio(6, AudioData(SOUND_MP3, Noise(50))).video(7, g_avc_end).script(script).build();
    constexpr uint32_t s = SCRIPT, k = KEY, vc = VIDEO | CONFIG, kc = KEY | CONFIG, ac = AUDIO | CONFIG;
    // The kinds reported when such tags are wanted, on the way forward and on the way backward.
    using Kinds = std::vector<uint32_t>;
    const std::tuple<uint32_t, Kinds, Kinds> cases[] = {
        {ANY, {s, kc, ac, k, 1, 2, vc, k, kc, vc, ac, k, s, 0}, {s, 1, 2, 1, 1, 1, 1, 2, 1, 1, 2, 1, s, 0}},
        {vc | ac, {vc, ac, vc, kc, vc, ac, 0}, {2, 1, 1, vc, ac, vc, 0}},
        {kc | AUDIO, {k, ac, k, k, k, ac, k, 0}, {k, 2, k, k, k, ac, k, 0}}};
    for (const auto& [wanted, forward, backward] : cases) {
        Reader r(flv.bytes);
        r.at(DATA_OFFSET);
        for (const uint32_t kind : forward)
            EXPECT_EQ(std::get<2>(r.next(wanted)), kind);
        r.at(r.end);
        for (const uint32_t kind : backward)
            EXPECT_EQ(std::get<2>(r.prev(wanted)), kind);
    }
}

TEST(FindNextTag, CountsTheBytesToTheNextCandidate)
{
    const auto find = [](int64_t distance, int64_t limit) {
        SCOPED_TRACE(testing::PrintToString(std::pair(distance, limit)));
        const bool covered = distance < (limit + WINDOW - 1) / WINDOW * WINDOW; // whole windows are looked at
        Reader r(Zeros(100 + distance) + Sound(), CACHE, 16);
        EXPECT_EQ(r.at(100).find(limit), covered ? distance : NOT_FOUND);
        EXPECT_EQ(__FLV_DMX__fioGetCacheReadSize(r.file), 16u);
        const auto reads = static_cast<int64_t>(r.host.calls(HostFn::Read));
        EXPECT_TRUE(!covered || (reads == distance / WINDOW + 1 && __FLV_DMX__fioTell64(r.file) == 100 + distance));
    };
    for (const int64_t distance : {int64_t{0}, int64_t{1}, WINDOW - 1, WINDOW, SCANNED - 1, SCANNED})
        for (const int64_t limit : {int64_t{0}, int64_t{1}, WINDOW, WINDOW + 1, MIB})
            find(distance, limit);
    EXPECT_EQ(Reader(Bytes() + Sound(), 12).at(0).find(), NOT_FOUND); // no header fits this cache
}

// A sound tag of 20 bytes whose header is plausible and whose back-pointer is not; and many of them.
const Tag BAD{8, 0, Bytes{0xAF, 1, 0xEE, 0xEE, 0xEE}, 0xEEEEEEEE};
constexpr int64_t BAD_SIZE = 20, CHECKS = 16384; // of which one search makes so many
const auto Bad = [](int64_t count) { return File(std::vector(static_cast<size_t>(count), BAD)).body(); };

TEST(Resynchronisation, CoversOneMiBInAll)
{
    // Where each step finds the wanted picture from place 100 on, or what it returns.
    const auto expect = [](const Bytes& damage, const std::array<int64_t, 3>& results) {
        SCOPED_TRACE(damage.size());
        Reader r(Concat({Zeros(100), damage}));
        for (size_t i = 0; i < results.size(); ++i) {
            const auto [rc, pos, kind] = (r.at(100).*FORWARD[i])(VIDEO);
            EXPECT_EQ(rc + pos, results[i]) << i;
        }
    };
    const auto all = [&expect](const Bytes& damage, int64_t result) { expect(damage, {result, result, result}); };
    all(Zeros(MIB) + Picture(), 100 + MIB);
    all(Zeros(MIB + 1) + Picture(), NOT_FOUND);
    all(Zeros(MIB / 2), ENDED);
    const int64_t far = MIB / 2 + 1000, second = 100 + far + 115 + far; // a sound tag restores the careful budget alone
    expect(Concat({Zeros(far) + Sound(), Zeros(far) + Picture()}), {second, NOT_FOUND, second});
    // A failed check costs no distance: with one every 64 bytes all of the MiB is crossed.
    const Bytes sparse = Concat(std::vector<Bytes>(MIB / 64 - 1, Concat({Bad(1), Zeros(64 - BAD_SIZE)})));
    all(sparse + Picture(), 100 + MIB - 64);
    all(Bad(CHECKS - 1) + Picture(), 100 + (CHECKS - 1) * BAD_SIZE);
    expect(Bad(CHECKS) + Picture(), {NOT_FOUND, 100 + CHECKS * BAD_SIZE, NOT_FOUND});
    // Nor does one after which the scan finds nothing: the whole MiB is left.
    const Bytes gap = Concat({Bad(1), Zeros(1 + SCANNED - BAD_SIZE + MIB)});
    expect(gap + Picture(), {101 + SCANNED + MIB, NOT_FOUND, 101 + SCANNED + MIB});
    all(Concat({gap, {0}}) + Picture(), NOT_FOUND);
}

TEST(Resynchronisation, CountsFailedChecksAnewInEachSearch)
{
    Reader r(Concat({Zeros(100), Bad(2 * CHECKS - 1)}) + Picture());
    for (const Step step : {&Reader::verify, &Reader::next}) {
        EXPECT_EQ((r.at(100).*step)(VIDEO), Found(NOT_FOUND, 0, 0));
        const auto [rc, pos, kind] = (r.*step)(VIDEO); // on from there
        EXPECT_EQ(rc + pos, 100 + (2 * CHECKS - 1) * BAD_SIZE);
    }
}

// A budget that is used up tells the end of the data by the place where that happened.
TEST(Resynchronisation, EndsWithTheDataWhenNoHeaderFitsBeforeTheirEnd)
{
    Reader r(Zeros(2 * MIB));
    for (const int64_t left : {12, 13}) {
        r.ctx.data_end = 101 + SCANNED + left; // a byte is skipped, then windows are scanned
        EXPECT_EQ(r.at(100).next(ANY), Found(left < 13 ? ENDED : NOT_FOUND, 0, 0));
        EXPECT_EQ(__FLV_DMX__fioTell64(r.file), 101 + SCANNED);
    }
}

// The scan after a bad tag gets no bytes; the host then recovers, and the budget is used up far from the end.
TEST(Resynchronisation, ForgetsAnEndOfDataThatWasNone)
{
    Reader r(Concat({Zeros(100), Bad(1), Zeros(3 * MIB)}));
    r.at(100).host.fail_nth(HostFn::Read, 2);
    EXPECT_EQ(r.verify(ANY), Found(NOT_FOUND, 0, 0));
}

TEST(Position, ThatDoesNotAdvanceEndsASearch)
{
    // A picture of 65 bytes and 15 more, audio of 115 bytes in all, a picture; the first starts at FIRST_TAG.
    const Bytes bytes = Zeros(FIRST_TAG) + Picture(65) + Sound() + Picture();
    const int64_t audio = FIRST_TAG + 80, last = audio + 115;
    const Step describe = &Reader::verify, next = &Reader::next, prev = &Reader::prev;
    const Found none(NOT_FOUND, 0, 0);
    const struct {
        Step step;
        int64_t from;
        uint64_t nth; // position query
        int64_t error;
        Found found;
    } rows[] = {
        {.step = describe, .from = audio, .nth = 2, .error = -1, .found = none},   // the tag starts before the search
        {.step = describe, .from = audio, .nth = 3, .error = -115, .found = none}, // after the tag: where it starts
        {.step = describe, .from = audio, .nth = 3, .error = -114, .found = {0, last, 0}}, // a byte on
        {.step = next, .from = audio, .nth = 3, .error = -115, .found = none},
        {.step = next, .from = audio, .nth = 3, .error = -114, .found = {0, last, KEY}},
        {.step = prev, .from = last, .nth = 2, .error = 115, .found = none}, // before the tag: where it ends
        {.step = prev, .from = last, .nth = 2, .error = 114, .found = {0, FIRST_TAG, VIDEO}}, // a byte back
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(&row - rows);
        Reader r(bytes);
        r.at(row.from);
        std::tie(r.host.nth, r.host.error) = std::tie(row.nth, row.error);
        EXPECT_EQ((r.*row.step)(VIDEO), row.found);
    }
}

TEST(PrevTag, SlidesBackOneMiBInAll)
{
    Reader r(Zeros(FIRST_TAG) + Sound() + Picture() + Sound());
    r.at(r.end).host.fail_nth(HostFn::Tell, 2);
    EXPECT_EQ(r.prev(VIDEO), Found(NOT_FOUND, 0, 0));
    Reader twice(Concat({Zeros(FIRST_TAG) + Sound(), Zeros(MIB - 1) + Picture(), {0}}), CACHE, 16);
    EXPECT_EQ(twice.at(twice.end).prev(AUDIO), Found(0, FIRST_TAG, AUDIO)); // the picture restores the budget
    Reader just(Zeros(DATA_OFFSET + MIB + 4), CACHE, 16);
    EXPECT_EQ(just.at(just.end).prev(ANY), Found(FLVD_ERR_AT_FIRST_TAG, 0, 0));
    Reader spent(Concat({Zeros(FIRST_TAG) + Sound(), Zeros(MIB)}), CACHE, 16);
    EXPECT_EQ(spent.at(spent.end).prev(ANY), Found(NOT_FOUND, 0, 0));
}

TEST(HostCalls, OfTheBackPointerCheck)
{
    const auto check = [](size_t size, uint32_t quantum, const std::string& log, uint32_t most = CACHE) {
        Reader r(Zeros(FIRST_TAG) + Sound(size) + Picture(), CACHE, quantum);
        r.at(FIRST_TAG).host.limit_reads(most);
        r.host.start_log();
        EXPECT_EQ(FLVD_GetCurrTagInfo(&r.ctx, r.file, &r.info, AUDIO, 1), 0);
        const std::string calls = r.host.take_log();
        EXPECT_EQ(calls.substr(0, log.size()), log);
        EXPECT_EQ(calls.find("seek", log.size()), std::string::npos);
        EXPECT_EQ(__FLV_DMX__fioGetCacheReadSize(r.file), quantum != 0 ? quantum : CACHE);
    };
    const std::string whole = "tell64()=13 eof()=0 read(4096)=4096 tell64()=4109";
    check(100, 0, "tell64()=13 eof()=0 read(4096)=230 tell64()=243");
    check(4081, 0, whole);
    check(4082, 0, whole + " read(1)=1 seek64(13,0)=0");
    check(5000, 0, whole + " seek64(915,1)=0 read(4)=4 seek64(13,0)=0");
    check(100, 0, "tell64()=13 eof()=0 read(4096)=50 tell64()=63 read(4046)=50 read(3996)=50 seek64(13,0)=0", 50);
    check(100, 16, "tell64()=13 eof()=0 read(16)=16 tell64()=29 seek64(95,1)=0 read(16)=16 seek64(13,0)=0");
    check(100, 5, "tell64()=13 eof()=0 read(13)=13 tell64()=26 seek64(98,1)=0 read(5)=5 seek64(13,0)=0");
}

TEST(HostCalls, ASeekBackToATagIsTriedOnce)
{
    const struct {
        const char* what;
        Step step;
        int64_t from;
        uint64_t seek; // the one that goes back to the tag
    } rows[] = {{.what = "describing", .step = &Reader::verify, .from = FIRST_TAG, .seek = 2},
                {.what = "stepping", .step = &Reader::next, .from = DATA_OFFSET, .seek = 3}};
    for (const auto& row : rows) {
        Reader r(Zeros(FIRST_TAG) + Sound(5000) + Picture());
        r.at(row.from).host.fail_nth(HostFn::Seek, row.seek);
        EXPECT_EQ((r.*row.step)(AUDIO), Found(NOT_FOUND, 0, 0)) << row.what;
        EXPECT_EQ(r.host.calls(HostFn::Seek), row.seek) << row.what;
    }
}

// What opening finds out: end of the valid data, last timestamp, seek method, index entries, time of the last keyframe.
using Extent = std::tuple<int64_t, uint32_t, uint32_t, uint32_t, uint32_t>;
Extent Probe(const Bytes& file, const OpenOptions& open = {})
{
    FakeHost host(file);
    Session session(host, open);
    EXPECT_TRUE(session.opened());
    const flvd_ctx_t ctx = session.opened() ? *session.ctx() : flvd_ctx_t{};
    EXPECT_EQ(ctx.last_keyframe_ms, ctx.video_info.last_key_time_ms);
    return {ctx.data_end, ctx.last_ts, ctx.seek_method, ctx.keyframe_index.entry_count, ctx.last_keyframe_ms};
}
const OpenOptions QUICK{0, true};

// Pictures every 40 ms, each second one a keyframe, sound up to 782 ms.
const ChainOptions CHAIN = {true, true, false, false, 20, 2};
const auto Indexed = [](const IndexHook& hook) { return MakeChain({true, true, true, true, 20, 2, 0, hook}); };

TEST(Extent, EndsWithTheLastTag)
{
    const Flv flv = MakeChain(CHAIN);
    const auto behind = [&flv](const Bytes& more) { return Concat({flv.bytes, more}); };
    for (const Bytes& more : {Bytes(), Bytes(100, 0xEE), Bad(3 * MIB / BAD_SIZE)})
        EXPECT_EQ(Probe(behind(more)), Extent(flv.size(), 782, FLVD_SEEK_BY_SCAN, 0, 0));
    EXPECT_EQ(Probe(behind(Bytes(15, 0xEE)), QUICK), Extent(flv.size(), 782, FLVD_SEEK_NONE, 0, 0));
    EXPECT_EQ(Probe(behind(Bytes(16, 0xEE)), QUICK), Extent(flv.size() + 16, 0, FLVD_SEEK_NONE, 0, 0));
    const Bytes half = File(std::vector(20, Sound(100000)), 4).bytes + Sound();
    EXPECT_EQ(Probe(Concat({half, Zeros(3 * MIB)})), Extent(half.size(), 5, FLVD_SEEK_BY_SCAN, 0, 0));
    for (uint64_t nth = 255; nth < 275; ++nth) { // a seek of the tail, of the halving or of the last places
        FakeHost host(behind(Zeros(3 * MIB)));
        host.fail_nth(HostFn::Seek, nth);
        Session session(host);
        EXPECT_TRUE(session.failed_as_listed(Op::Open, session.open_rc())) << nth;
    }
}

TEST(Extent, TakesTheLargestTimeOfTheLastTags)
{
    const auto last = [](std::vector<Tag> tags, uint32_t sounds) {
        for (uint32_t i = 0; i < sounds; ++i)
            tags.push_back(Pcm(900 - i));
        return std::get<1>(Probe(File(tags).bytes));
    };
    const Tag picture{9, 1700, VideoData(2, CODEC_SCREEN, Noise(50))};
    EXPECT_EQ(last({Screen(0), Screen(700)}, 1), 900u);
    EXPECT_EQ(last({Screen(0), picture}, 9), 1700u);
    EXPECT_EQ(last({Screen(0), picture}, 10), 900u); // the eleventh from the end
    EXPECT_EQ(last({}, 2), 899u);                    // sound alone: the last tag decides
}

TEST(Extent, TrimsAKeyframeIndexToTheData)
{
    const Flv flv = Indexed({});
    const auto cut = [&flv](size_t tag) { // 20 bytes into it
        return Bytes(flv.bytes.data(), flv.bytes.data() + flv.tags[tag].offset + 20);
    };
    const Bytes cut_key = cut(31), cut_picture = cut(34);
    const Bytes last = Indexed([](auto&, auto& at) { at.back() = -5; }).bytes; // no matter: all entries are inside
    const Bytes astray =
        Indexed([&](auto&, auto& at) { at[3] = static_cast<double>(flv.size()) + 24, at[4] = 1e12; }).bytes;
    // Neither the last position inside the file nor the bytes behind its tags lead to a tag.
    const Bytes no_step = Concat({astray, Bytes(20, 0xEE), {0, 0, 0, 7, 0xEE}});
    for (const uint32_t options : {INDEX, 0u}) {
        const auto extent = [options](const Bytes& file) { return Probe(file, {options}); };
        for (const Bytes& whole : {flv.bytes, last})
            EXPECT_EQ(extent(whole), Extent(flv.size(), 782, FLVD_SEEK_BY_INDEX, 10, 720));
        // One entry behind the end stays.
        EXPECT_EQ(extent(cut_picture), Extent(cut_picture.size() - 20, 437, FLVD_SEEK_BY_INDEX, 7, 480));
        EXPECT_EQ(extent(cut_key), Extent(cut_key.size() - 20, 391, FLVD_SEEK_BY_INDEX, 6, 400));
        EXPECT_EQ(extent(no_step), Extent(flv.size(), 782, FLVD_SEEK_BY_INDEX, 4, 240));
    }
}

} // namespace
