// Tag navigation: which headers count, how damage is crossed, what a step costs the host, and where the valid data of
// an opened file ends.

#include "support/report.h"
#include "support/session.h"

#include <array>
#include <cmath>

using namespace flvd_test;

namespace {

static_assert(VIDEO == FLVD_TAG_VIDEO && AUDIO == FLVD_TAG_AUDIO);
constexpr uint32_t SCRIPT = FLVD_TAG_SCRIPT, CONFIG = FLVD_TAG_CONFIG;
constexpr uint32_t KEY = VIDEO | FLVD_TAG_KEYFRAME, ANY = VIDEO | AUDIO | SCRIPT;
constexpr int32_t NOT_FOUND = FLVD_ERR_NOT_FOUND, AT_FIRST = FLVD_ERR_AT_FIRST_TAG, ENDED = FLVD_ERR_END_OF_DATA;
constexpr int64_t DATA_OFFSET = 9, FIRST_TAG = 13;
constexpr uint32_t CACHE = 4096;
constexpr int64_t MIB = 0x100000;                        // what resynchronisation covers
constexpr int64_t WINDOW = CACHE - 12;                   // candidate starts in a cache
constexpr int64_t SCANNED = (MIB / WINDOW + 1) * WINDOW; // what a failed scan has looked at

using Found = std::tuple<int32_t, int64_t, uint32_t>; // result, place and kind, the latter two on success alone
Found Failed(int32_t rc)
{
    return {rc, 0, 0};
}

// A reader on some bytes, with an instance that knows nothing of its streams.
class Reader {
public:
    explicit Reader(const Bytes& bytes, uint32_t cache = CACHE, uint32_t quantum = 0) : host(bytes)
    {
        const fio_funcs_t funcs = host.funcs();
        __FLV_DMX__fioSetFunc(&funcs);
        file = __FLV_DMX__fioOpen(FakeHost::DEFAULT_FILE, FIO_MODE_READ | FIO_MODE_BINARY, cache, 0, 0);
        __FLV_DMX__fioSetCacheReadSize(file, quantum);
        ctx.cache_size = cache;
        ctx.data_offset = static_cast<int32_t>(DATA_OFFSET);
        ctx.data_end = end = static_cast<int64_t>(bytes.size());
        ctx.video_codec_filter = ctx.audio_format_filter = 0xFFFF;
    }
    ~Reader() { __FLV_DMX__fioClose(file); }

    FakeHost host;
    flvd_ctx_t ctx{};
    fio_file_t* file;
    int64_t end;

    Reader& at(int64_t pos)
    {
        host.fail_nothing();
        EXPECT_EQ(__FLV_DMX__fioSeek64(file, pos, FIO_SEEK_SET), 0);
        host.reset_calls();
        return *this;
    }
    Found verify(uint32_t wanted) { return found(FLVD_GetCurrTagInfo(&ctx, file, &m_info, wanted, 1)); }
    Found trust(uint32_t wanted) { return found(FLVD_GetCurrTagInfo(&ctx, file, &m_info, wanted, 0)); }
    Found next(uint32_t wanted) { return found(FLVD_MoveToNextTag(&ctx, file, &m_info, wanted, &m_kind)); }
    Found prev(uint32_t wanted) { return found(FLVD_MoveToPrevTag(&ctx, file, &m_info, wanted, &m_kind)); }
    int64_t find(int64_t limit = MIB) { return FLVD_FindNextTag(&ctx, file, static_cast<uint32_t>(limit)); }

private:
    // A record is written on success alone, and then describes the header that the reader stands on.
    Found found(int32_t rc)
    {
        const flvd_tag_info_t info = std::exchange(m_info, {77, 77, 77, 77});
        const uint32_t kind = std::exchange(m_kind, 0);
        Bytes header;
        Put(header, uint64_t{info.type} << 24 | info.data_size, 4);
        Put(header, uint64_t{info.timestamp << 8} << 24 | uint64_t{info.timestamp >> 24} << 24 | info.stream_id, 7);
        Bytes expected{77, 0, 0, 77, 0, 0, 77, 0, 0, 0, 77};
        if (rc == 0)
            expected.resize(__FLV_DMX__fioShowBytesByCopy(expected.data(), 11, file));
        EXPECT_EQ(header, expected);
        return {rc, rc == 0 ? __FLV_DMX__fioTell64(file) : 0, kind};
    }

    flvd_tag_info_t m_info{77, 77, 77, 77};
    uint32_t m_kind = 0;
};
using Step = Found (Reader::*)(uint32_t wanted);
constexpr Step FORWARD[] = {&Reader::verify, &Reader::trust, &Reader::next};

// Tags that fit the cache, narrow reads, and tags larger than the cache take different ways to the same result.
constexpr std::pair<uint32_t, uint32_t> READERS[] = {{CACHE, 0}, {CACHE, 16}, {64, 0}};

Tag Sound(size_t size = 100, std::optional<uint32_t> back_pointer = {})
{
    return {8, 5, AacRaw(Noise(size - 2)), back_pointer};
}
Tag Picture(size_t size = 100, std::optional<uint32_t> back_pointer = {})
{
    return {9, 5, AvcNalu(true, Noise(size - 5)), back_pointer};
}
// As it stands in a file.
Bytes operator+(const Bytes& front, const Tag& tag)
{
    const Bytes file = FlvBuilder().add(tag).build().bytes;
    return Concat({front, Bytes(file.begin() + FIRST_TAG, file.end())});
}
Bytes Zeros(int64_t count)
{
    return Bytes(static_cast<size_t>(count));
}

TEST(TagHeader, IsPlausibleForThisFile)
{
    struct Case {
        uint32_t type, first, timestamp, last_ts, data_end, video, audio; // last three: 0 leaves what allows all
        const char* passes; // header test, candidate of a resynchronisation, tag in front of a back-pointer
    };
    constexpr uint32_t top = 0xFFFFFFFF, half = 0x80000000;
    const Case cases[] = {{18, 2, 0, 0, 0, 0x17, 0xAF, "HFP"},       {9, 0x17, 0, 0, 100, 0, 0, "--P"},
                          {9, 0x17, 0, 0, 101, 0, 0, "HFP"},         {9, 0x17, 999, 1000, 0, 0, 0, "HFP"},
                          {9, 0x17, 1000, 1000, 0, 0, 0, "H-P"},     {9, 0x17, 1001, 1000, 0, 0, 0, "---"},
                          {18, 2, 1001, 1000, 0, 0, 0, "---"},       {8, 0xAF, top, 0, 0, 0, 0, "H-P"},
                          {8, 0xAF, top - 1, 0, 0, 0, 0, "HFP"},     {8, 0xAF, 1 << 24, 7, 0, 0, 0, "---"},
                          {8, 0xAF, half, half - 1, 0, 0, 0, "---"}, {9, 0x27, 0, 0, 0, 0x17, 0, "HFP"},
                          {9, 0x57, 0, 0, 0, 0x17, 0xAF, "HFP"},     {9, 0x67, 0, 0, 0, 0x17, 0, "---"},
                          {9, 0x67, 0, 0, 0, 0, 0, "HFP"},           {9, 0x14, 0, 0, 0, 0x17, 0, "---"},
                          {9, 0x10, 0, 0, 0, 0x10, 0, "HFP"},        {8, 0xAF, 0, 0, 0, 0x17, 0xAF, "HFP"},
                          {8, 0xAE, 0, 0, 0, 0, 0xAF, "---"},        {8, 0x2F, 0, 0, 0, 0x17, 0, "HFP"},
                          {10, 0x17, 0, 0, 0, 0, 0, "---"},          {0x28, 0xAF, 0, 0, 0, 0, 0, "---"}};
    for (const Case& c : cases) {
        SCOPED_TRACE(&c - cases);
        const Bytes data = Concat({{static_cast<uint8_t>(c.first), 1}, Noise(98)});
        Reader r(Zeros(FIRST_TAG) + Tag{static_cast<uint8_t>(c.type), c.timestamp, data, {}, {}, 0x30405});
        r.ctx.data_end = c.data_end != 0 ? c.data_end : r.end;
        r.ctx.last_ts = c.last_ts;
        r.ctx.video_codec_filter = c.video != 0 ? c.video : 0xFFFF;
        r.ctx.audio_format_filter = c.audio != 0 ? c.audio : 0xFFFF;
        for (const Step step : FORWARD)
            EXPECT_EQ(std::get<0>((r.at(DATA_OFFSET).*step)(ANY)), c.passes[0] == 'H' ? 0 : ENDED);
        EXPECT_EQ(r.at(FIRST_TAG).find(), c.passes[1] == 'F' ? 0 : NOT_FOUND);
        EXPECT_EQ(std::get<0>(r.at(r.end).prev(ANY)), c.passes[2] == 'P' ? 0 : AT_FIRST);
    }
}

TEST(TagKinds, AreFilteredAndReportedInBothDirections)
{
    FlvBuilder builder;
    builder.script(amf::Number(1)).video(0, AvcConfig(SmallAvcRecord())).audio(0, AacConfig({0x12, 0x10}));
    builder.add(Picture()).video(1, AvcNalu(false, Noise(60))).add(Sound());
    builder.video(2, Concat({{0x27, 0, 0, 0, 0}, Noise(70)})); // a sequence header in an inter frame
    builder.video(3, Concat({{0x47, 1, 0, 0, 0}, Noise(80)})); // a generated keyframe
    builder.video(4, VideoData(1, CODEC_H263, Noise(90))).video(5, VideoData(2, CODEC_H263, Noise(40)));
    const Flv flv = builder.audio(6, AudioData(SOUND_MP3, Noise(50))).video(7, AvcEnd()).script(amf::Number(1)).build();
    struct Case {
        uint32_t wanted;
        std::vector<size_t> tags;
        std::vector<uint32_t> forward, backward;
    };
    constexpr uint32_t s = SCRIPT, k = KEY, vc = VIDEO | CONFIG, kc = KEY | CONFIG, ac = AUDIO | CONFIG;
    const Case cases[] = {{ANY,
                           {0, 1, 2, 3, 4, 5, 6, 7, 8, 9, 10, 11, 12},
                           {s, kc, ac, k, 1, 2, vc, k, kc, vc, ac, k, s},
                           {s, 1, 2, 1, 1, 2, 1, 1, 1, 1, 2, 1, s}},
                          {AUDIO, {2, 5, 10}, {ac, 2, ac}, {2, 2, 2}},
                          {ac, {2, 10}, {ac, ac}, {ac, 2}},
                          {vc, {1, 6, 8, 9}, {vc, vc, kc, vc}, {vc, vc, 1, 1}},
                          {KEY, {1, 3, 7, 8, 11}, {k, k, k, k, k}, {k, k, k, k, k}},
                          {kc | AUDIO, {1, 2, 3, 7, 8, 10, 11}, {k, ac, k, k, k, ac, k}, {k, ac, k, k, k, 2, k}},
                          {kc & ~VIDEO, {}, {}, {}}};
    for (const auto& [cache, quantum] : READERS) {
        Reader r(flv.bytes, cache, quantum);
        for (const Case& c : cases) {
            SCOPED_TRACE(c.wanted);
            const auto offset = [&](size_t i) { return i < c.tags.size() ? flv.tags[c.tags[i]].offset : 0; };
            for (const Step step : FORWARD) {
                r.at(DATA_OFFSET);
                for (size_t i = 0; i < c.tags.size(); ++i) {
                    EXPECT_EQ((r.*step)(c.wanted), Found(0, offset(i), step == &Reader::next ? c.forward[i] : 0));
                    r.at(step == &Reader::next ? offset(i) : flv.tags[c.tags[i]].end());
                }
                EXPECT_EQ((r.*step)(c.wanted), Failed(ENDED));
            }
            r.at(r.end);
            for (size_t i = c.tags.size(); i-- > 0;)
                EXPECT_EQ(r.prev(c.wanted), Found(0, offset(i), c.backward[i]));
            EXPECT_EQ(r.prev(c.wanted), Failed(AT_FIRST));
            EXPECT_LE(r.host.calls(HostFn::Read), 4 * flv.tags.size()); // unwanted tags are not slid over
        }
    }
}

TEST(BackPointer, HasToAgreeButForTheFirstScriptTag)
{
    const Tag script{18, 0, amf::Number(1), 7u};
    const Tag bad{8, 5, Concat({AacRaw(Noise(30)), Bytes() + Picture(60), Noise(30)}), 149u};
    const Flv flv = FlvBuilder().add(script).add(bad).add(Picture(200)).add(script).add(Sound()).build();
    const int64_t start = flv.tags[1].offset, inside = start + 11 + 32; // of the bad tag
    for (const auto& [cache, quantum] : READERS) {
        Reader r(flv.bytes, cache, quantum);
        EXPECT_EQ(r.at(DATA_OFFSET).verify(ANY), Found(0, FIRST_TAG, 0));
        EXPECT_EQ(r.at(DATA_OFFSET).verify(AUDIO | VIDEO), Found(0, inside, 0));
        EXPECT_EQ(r.at(DATA_OFFSET).trust(AUDIO), Found(0, start, 0));
        EXPECT_EQ(r.at(start).next(ANY), Found(0, inside, KEY));
        EXPECT_EQ(r.at(FIRST_TAG).next(ANY), Found(0, inside, KEY));
        EXPECT_EQ(r.next(ANY), Found(0, flv.tags[2].offset, KEY));
        EXPECT_EQ(r.next(ANY), Found(0, flv.tags[4].offset, AUDIO));
        EXPECT_EQ(r.next(ANY), Failed(ENDED));
        for (const Tag& first : {script, Sound(9)}) { // cut in its back-pointer
            Bytes cut = Zeros(FIRST_TAG) + first;
            cut.pop_back();
            const Found found = Reader(cut, cache, quantum).at(DATA_OFFSET).verify(ANY);
            EXPECT_EQ(found, first.type == 18 ? Found(0, FIRST_TAG, 0) : Failed(ENDED));
        }
    }
}

TEST(FindNextTag, CountsTheBytesToTheNextCandidate)
{
    struct Case {
        int64_t distance, limit, result;
    };
    const Case cases[] = {{0, MIB, 0},
                          {1, MIB, 1},
                          {5000, MIB, 5000},
                          {WINDOW - 1, 1, WINDOW - 1},
                          {WINDOW, WINDOW, NOT_FOUND},
                          {WINDOW, WINDOW + 1, WINDOW},
                          {0, 0, NOT_FOUND},
                          {SCANNED - 1, MIB, SCANNED - 1},
                          {SCANNED, MIB, NOT_FOUND}};
    for (const auto& [distance, limit, result] : cases) {
        SCOPED_TRACE(distance);
        Reader r(Zeros(100 + distance) + Sound(), CACHE, 16);
        EXPECT_EQ(r.at(100).find(limit), result);
        EXPECT_EQ(__FLV_DMX__fioGetCacheReadSize(r.file), 16u);
        const auto reads = static_cast<int64_t>(r.host.calls(HostFn::Read));
        EXPECT_TRUE(result < 0 || (reads == distance / WINDOW + 1 && __FLV_DMX__fioTell64(r.file) == 100 + distance));
    }
    for (const size_t left : {12u, 13u}) {
        Bytes bytes = Zeros(100) + Sound();
        bytes.resize(100 + left);
        EXPECT_EQ(Reader(bytes).at(100).find(), left < 13 ? NOT_FOUND : 0);
    }
    EXPECT_EQ(Reader(Bytes() + Sound(), 12).at(0).find(), NOT_FOUND); // no header fits this cache
}

// A sound tag of 20 bytes whose header is plausible and whose back-pointer is not; and many of them.
const Tag BAD{8, 0, Bytes{0xAF, 1, 0xEE, 0xEE, 0xEE}, 0xEEEEEEEE};
constexpr int64_t BAD_SIZE = 20, BAD_COST = BAD_SIZE - 1 + 64; // the distance to the next, and the penalty
Bytes Bad(int64_t count)
{
    Bytes out;
    for (const Bytes one = Bytes() + BAD; count > 0; --count)
        Append(out, one);
    return out;
}

TEST(Resynchronisation, CoversOneMiBInAll)
{
    // Where each step finds the wanted picture from place 100 on, or what it returns.
    const auto expect = [](const Bytes& damage, const std::array<int64_t, 3>& results, int64_t data_end = 0) {
        SCOPED_TRACE(damage.size());
        Reader r(Concat({Zeros(100), damage}));
        r.ctx.data_end = data_end != 0 ? data_end : r.end;
        for (size_t i = 0; i < results.size(); ++i) {
            const auto [rc, pos, kind] = (r.at(100).*FORWARD[i])(VIDEO);
            EXPECT_EQ(rc + pos, results[i]) << i;
        }
    };
    const auto all = [&expect](const Bytes& damage, int64_t result) { expect(damage, {result, result, result}); };
    all(Zeros(MIB) + Picture(), 100 + MIB);
    all(Zeros(MIB + 1) + Picture(), NOT_FOUND);
    all(Zeros(MIB / 2), ENDED);
    all(Zeros(2 * MIB), NOT_FOUND);
    all(Zeros(12), ENDED);
    const int64_t far = MIB / 2 + 1000, second = 100 + far + 115 + far; // a sound tag restores the careful budget alone
    expect(Concat({Zeros(far) + Sound(), Zeros(far) + Picture()}), {second, NOT_FOUND, second});
    expect(Concat({Bytes() + Sound(), Zeros(2 * MIB)}), {NOT_FOUND, NOT_FOUND, ENDED}, 215);
    const int64_t spent = (MIB + BAD_COST - 1) / BAD_COST, after = 100 + spent * BAD_SIZE;
    expect(Bad(spent) + Picture(), {NOT_FOUND, after, NOT_FOUND});
    all(Bad(spent - 1) + Picture(), after - BAD_SIZE);
    all(Concat({Bad(spent - 1) + Sound(), Bad(spent - 1) + Picture()}), 2 * after - 100 - 2 * BAD_SIZE + 115);
    const int64_t most = MIB - 64; // left after a bad tag behind which nothing was found
    const Bytes gap = Concat({Bad(1), Zeros(1 + SCANNED - BAD_SIZE + most)});
    expect(gap + Picture(), {101 + SCANNED + most, NOT_FOUND, 101 + SCANNED + most});
    all(Concat({gap, {0}}) + Picture(), NOT_FOUND);
    const int64_t close = after - BAD_SIZE + 13; // 12 bytes behind the place where next() gives up
    expect(Bad(spent) + Picture(), {NOT_FOUND, after, ENDED}, close);
}

TEST(PrevTag, SlidesBackWhereTheChainIsDamaged)
{
    const auto chain = [](std::optional<uint32_t> third = {}, std::optional<uint32_t> first = {}) {
        return FlvBuilder().add(Sound(100, first)).add(Picture()).add(Sound(90, third)).add(Picture(80)).build();
    };
    const Flv flv = chain();
    const int64_t first = flv.tags[0].offset, second = flv.tags[1].offset, last = flv.tags[3].offset;
    Reader r(Concat({flv.bytes, Zeros(37)}));
    for (const int64_t pos : {int64_t{5}, DATA_OFFSET, first})
        EXPECT_EQ(r.at(pos).prev(ANY), Failed(AT_FIRST));
    EXPECT_EQ(r.at(second).prev(ANY), Found(0, first, AUDIO));
    EXPECT_EQ(r.at(r.end).prev(ANY), Found(0, last, VIDEO));
    r.at(last).host.fail_nth(HostFn::Tell, 2);
    EXPECT_EQ(r.prev(VIDEO), Failed(NOT_FOUND));
    r.ctx.data_offset = static_cast<int32_t>(second) - 4;
    EXPECT_EQ(r.at(second).prev(ANY), Failed(AT_FIRST));
    r.ctx.video_codec_filter = CODEC_H263; // the picture is slid over, not stepped over
    EXPECT_EQ(r.at(r.end - 37).prev(ANY), Found(0, flv.tags[2].offset, AUDIO));
    EXPECT_GE(r.host.calls(HostFn::Read), 80u);
    EXPECT_EQ(Reader(chain({}, 12).bytes).at(second).prev(ANY), Failed(AT_FIRST));
    const auto cursor = static_cast<uint32_t>(last - 4), astray = cursor - static_cast<uint32_t>(first);
    for (const uint32_t damage : {0u, 0x80000065u, 0xFFFFFFFFu, cursor, cursor + 1, cursor - 1, 102u, astray})
        EXPECT_EQ(Reader(chain(damage).bytes).at(last).prev(ANY), Found(0, second, VIDEO)) << damage;
    const Bytes eight = Concat({flv.bytes, {0, 0, 0, 8}}); // leads to 12 bytes before the end
    EXPECT_EQ(Reader(eight).at(flv.tags[3].end() + 4).prev(ANY), Failed(ENDED));
    EXPECT_EQ(Reader(Concat({eight, {0}})).at(flv.tags[3].end() + 4).prev(ANY), Found(0, last, VIDEO));
    Reader twice(Concat({Zeros(FIRST_TAG) + Sound(), Zeros(MIB - 1) + Picture(), {0}}), CACHE, 16);
    EXPECT_EQ(twice.at(twice.end).prev(AUDIO), Found(0, FIRST_TAG, AUDIO)); // the picture restores the budget
    Reader spent(Concat({Zeros(FIRST_TAG) + Sound(), Zeros(MIB)}), CACHE, 16);
    EXPECT_EQ(spent.at(spent.end).prev(ANY), Failed(NOT_FOUND));
}

TEST(HostCalls, OfTheBackPointerCheck)
{
    const auto check = [](const Tag& tag, uint32_t quantum, const std::string& log) {
        Reader r(Zeros(FIRST_TAG) + tag + Picture(), CACHE, quantum);
        r.at(FIRST_TAG).host.start_log();
        flvd_tag_info_t info;
        EXPECT_EQ(FLVD_GetCurrTagInfo(&r.ctx, r.file, &info, AUDIO, 1), tag.back_pointer ? ENDED : 0);
        const std::string calls = r.host.take_log();
        EXPECT_EQ(calls.substr(0, log.size()), log);
        EXPECT_EQ(calls.find("seek", log.size()), std::string::npos);
        EXPECT_EQ(__FLV_DMX__fioGetCacheReadSize(r.file), quantum != 0 ? quantum : CACHE);
        if (calls == log && tag.size() == 115 && quantum == 0) {
            FLVD_GetCurrTagInfo(&r.ctx, r.file, &info, VIDEO, 1); // the sound is passed, the picture taken
            EXPECT_EQ(r.host.take_log(), "tell64()=243 tell64()=243 tell64()=243 tell64()=243");
        }
    };
    const std::string whole = "tell64()=13 eof()=0 read(4096)=4096 tell64()=4109";
    check(Sound(), 0, "tell64()=13 eof()=0 read(4096)=230 tell64()=243");
    check(Sound(100, 7), 0, "tell64()=13 eof()=0 read(4096)=230 tell64()=243");
    check(Sound(4081), 0, whole);
    check(Sound(4082), 0, whole + " read(1)=1 seek64(13,0)=0");
    check(Sound(5000), 0, whole + " seek64(915,1)=0 read(4)=4 seek64(13,0)=0");
    check(Sound(), 16, "tell64()=13 eof()=0 read(16)=16 tell64()=29 seek64(95,1)=0 read(16)=16 seek64(13,0)=0");
    check(Sound(), 5, "tell64()=13 eof()=0 read(13)=13 tell64()=26 seek64(98,1)=0 read(5)=5 seek64(13,0)=0");
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
constexpr uint32_t MEMORY = FLVD_OPT_INDEX_IN_MEMORY, FROM_FILE = 0;
const OpenOptions QUICK{0, true};

// Pictures every 40 ms, each second one a keyframe, sound up to 782 ms; with `hook` a keyframe index.
Flv Chain(const IndexHook& hook = {})
{
    ChainOptions options;
    options.metadata = false;
    options.gop = 2;
    FlvBuilder builder;
    if (hook)
        builder.indexed_metadata({}, hook);
    for (const Tag& tag : MakeChain(options).tags)
        builder.add(tag);
    return builder.build();
}
// Cut 20 bytes into a picture.
Bytes CutIn(const Flv& flv, uint32_t picture)
{
    Bytes out = flv.bytes;
    for (const Tag& tag : flv.tags)
        if (tag.type == 9 && tag.is_frame() && tag.timestamp == 40 * picture)
            out.resize(static_cast<size_t>(tag.offset) + 20);
    return out;
}
Bytes Behind(const Flv& flv, size_t size)
{
    return Concat({flv.bytes, Bytes(size, 0xEE)});
}

TEST(Extent, EndsWithTheLastTag)
{
    const Flv flv = Chain();
    const auto size = static_cast<int64_t>(flv.bytes.size());
    for (const Bytes& file : {flv.bytes, Behind(flv, 100), Concat({flv.bytes, Bad(3 * MIB / BAD_SIZE)})})
        EXPECT_EQ(Probe(file), Extent(size, 782, FLVD_SEEK_BY_SCAN, 0, 0));
    EXPECT_EQ(Probe(Behind(flv, 15), QUICK), Extent(size, 782, FLVD_SEEK_NONE, 0, 0));
    EXPECT_EQ(Probe(Behind(flv, 16), QUICK), Extent(size + 16, 0, FLVD_SEEK_NONE, 0, 0));
    FlvBuilder large(4);
    for (int i = 0; i < 20; ++i)
        large.add(Sound(100000));
    const Flv half = large.add(Sound()).build();
    EXPECT_EQ(Probe(Concat({half.bytes, Zeros(3 * MIB)})), Extent(half.bytes.size(), 5, FLVD_SEEK_BY_SCAN, 0, 0));
    for (uint64_t nth = 255; nth < 275; ++nth) { // a seek of the tail, of the halving or of the last places
        FakeHost host(Concat({flv.bytes, Zeros(3 * MIB)}));
        host.fail_nth(HostFn::Seek, nth);
        Session session(host);
        EXPECT_TRUE(session.failed_as_listed(Op::Open, session.open_rc())) << nth;
    }
    FakeHost host(flv.bytes);
    host.start_log();
    const Session session(host);
    const std::string log = host.take_log();
    EXPECT_EQ(log.find("read(4096)", log.find("seek64(-4,2)")), std::string::npos); // backward by narrow reads
    EXPECT_EQ(session.ctx()->main_reader->read_size, CACHE);
}

TEST(Extent, TakesTheLargestTimeOfTheLastTags)
{
    const auto last = [](uint32_t picture, uint32_t sounds) {
        FlvBuilder builder;
        if (picture != 0)
            builder.video(0, VideoData(1, 3, Noise(50))).video(picture, VideoData(2, 3, Noise(50)));
        for (uint32_t i = 0; i < sounds; ++i)
            builder.audio(900 - i, AudioData(SOUND_PCM, Noise(40)));
        return std::get<1>(Probe(builder.build().bytes));
    };
    EXPECT_EQ(last(700, 1), 900u);
    EXPECT_EQ(last(1700, 9), 1700u);
    EXPECT_EQ(last(1700, 10), 900u); // the eleventh from the end
    EXPECT_EQ(last(0, 2), 899u);     // sound alone: the last tag decides
}

TEST(Extent, TrimsAKeyframeIndexToTheData)
{
    const Flv flv = Chain([](auto&, auto&) {});
    const auto size = static_cast<int64_t>(flv.bytes.size());
    const Bytes cut = CutIn(flv, 11), cut_key = CutIn(flv, 10);
    const Bytes one = Chain([](auto& times, auto& positions) { times.resize(1), positions.resize(1); }).bytes;
    const auto astray = [](double position) { // the last position inside the file leads to no tag
        return Chain([position](auto&, auto& positions) { positions[3] = position, positions[4] = 1e12; });
    };
    const Bytes no_step = Concat({Behind(astray(static_cast<double>(size + 24)), 20), {0, 0, 0, 7, 0xEE}});
    const Bytes last = Chain([](auto&, auto& positions) { positions.back() = -5; }).bytes;
    for (const uint32_t options : {MEMORY, FROM_FILE}) {
        const auto extent = [options](const Bytes& file) { return Probe(file, {options}); };
        EXPECT_EQ(extent(flv.bytes), Extent(size, 782, FLVD_SEEK_BY_INDEX, 10, 720));
        EXPECT_EQ(extent(Behind(flv, 100)), Extent(size, 782, FLVD_SEEK_BY_INDEX, 10, 720));
        EXPECT_EQ(extent(cut), Extent(cut.size() - 20, 437, FLVD_SEEK_BY_INDEX, 7, 480)); // one behind the end stays
        EXPECT_EQ(extent(cut_key), Extent(cut_key.size() - 20, 391, FLVD_SEEK_BY_INDEX, 6, 400));
        EXPECT_EQ(extent(one), Extent(one.size(), 782, FLVD_SEEK_NONE, 1, 0));
        EXPECT_EQ(extent(astray(std::nan("")).bytes), Extent(size, 782, FLVD_SEEK_BY_INDEX, 10, 720));
        EXPECT_EQ(extent(last), Extent(size, 782, FLVD_SEEK_BY_INDEX, 10, 720)); // no matter: all entries are inside
        EXPECT_EQ(extent(no_step), Extent(size, 782, FLVD_SEEK_BY_INDEX, 4, 240));
    }
}

TEST(Extent, TakesTheLastTimeThatAnIndexHas)
{
    const Bytes one = amf::Number(1), two = amf::Number(2), text = amf::String("a text");
    const auto index = [&](const std::vector<Bytes>& times, const Bytes& second) {
        std::vector<amf::Property> arrays{{"filepositions", amf::StrictArray({amf::Number(13), second, two})}};
        if (!times.empty())
            arrays.insert(arrays.begin(), {"times", amf::StrictArray(times)});
        return amf::Property("keyframes", amf::Object(arrays));
    };
    const auto extent = [](const std::vector<amf::Property>& properties, uint32_t options) {
        const Extent all = Probe(FlvBuilder(4).metadata(properties).add(Sound()).build().bytes, {options});
        return std::pair(std::get<2>(all), std::get<4>(all));
    };
    using Last = std::pair<uint32_t, uint32_t>;
    EXPECT_EQ(extent({index({one, two, text}, two)}, FROM_FILE), Last(FLVD_SEEK_BY_INDEX, 2000));
    EXPECT_EQ(extent({index({text, one, two}, two)}, FROM_FILE), Last(FLVD_SEEK_BY_INDEX, 0));
    EXPECT_EQ(extent({index({one, text, two}, text)}, FROM_FILE), Last(FLVD_SEEK_BY_INDEX, 1000));
    EXPECT_EQ(extent({index({}, two)}, FROM_FILE), Last(FLVD_SEEK_BY_SCAN, 0));
    EXPECT_EQ(extent({index({one}, two), index({}, two)}, MEMORY), Last(FLVD_SEEK_BY_INDEX, 1000));
}

TEST(Extent, RefusesAnIndexThatEndsEarlyOrLeadsInFrontOfTheFile)
{
    // Code and line in the instance when the open fails.
    const auto failure = [](const Bytes& file, uint32_t options) {
        FakeHost host(file);
        std::pair<int32_t, int32_t> out;
        host.on_release = [&out](const void* block, uint32_t size) {
            const auto* const ctx = static_cast<const flvd_ctx_t*>(block);
            out = size == sizeof(*ctx) ? std::pair{ctx->error, ctx->error_line} : out;
        };
        EXPECT_FALSE(Session(host, {options}).opened());
        EXPECT_EQ(g_flvd_lLastError, FLVD_ERR_EXTENT);
        return out;
    };
    using Site = std::pair<int32_t, int32_t>;
    const Bytes negative = Chain([](auto&, auto& positions) { positions[0] = -5, positions[1] = 1e12; }).bytes;
    EXPECT_EQ(failure(negative, MEMORY), Site(-2, 338));
    EXPECT_EQ(failure(negative, FROM_FILE), Site(-2, 308));
    const Bytes index =
        amf::Object({{"times", amf::NumberArray({1, 2, 3})}, {"filepositions", amf::NumberArray({13})}});
    Bytes early = FlvBuilder(4).add(Sound()).metadata({{"keyframes", index}}).build().bytes;
    early[early.size() - 4 - 6 - 9 - 1] = 3; // three positions are claimed
    EXPECT_EQ(failure(early, FROM_FILE), Site(0, 0));
}

} // namespace
