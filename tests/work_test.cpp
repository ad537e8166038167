// Work is limited: on the worst files that we know of, each operation stays within the limits of docs/damage.md for a
// file of that size; and playing, opening and seeking are cheap on valid files.

#include "support/report.h"
#include "support/session.h"
#include "support/sweep.h"

#include <algorithm>
#include <random>

using namespace flvd_test;

namespace {

constexpr uint64_t CACHE = 4096, BIG_CACHE = 1u << 20, NARROW = 16; // sizes of reads
constexpr uint64_t MIB = 1u << 20;
constexpr uint64_t REQUEST_CHECKS = 16384, REQUEST_TURNS = 102; // per request: failed checks in total, turns
constexpr uint64_t MOST_CALLS = 100000;                         // of one request, on the worst file that we know
constexpr uint64_t TAIL_CURSORS = MIB + 256;                    // positions tried in the search for the last tag
constexpr uint32_t FRAMES = 200, TINY = 80, BIG = 50000;        // of valid files; the cache does not hold BIG

struct Cost {
    uint64_t calls = 0, bytes = 0;
    friend Cost operator+(Cost a, Cost b) { return {a.calls + b.calls, a.bytes + b.bytes}; }
    friend Cost operator*(uint64_t n, Cost a) { return {n * a.calls, n * a.bytes}; }
};

constexpr Cost FALSE_HEADER = {5, 0}; // position, seek to its back-pointer, read, seek back, refill; bytes: Forward()
constexpr Cost TAG = {5, 0};          // positions before and after it; at a refill two queries of the end and a read
constexpr Cost LARGE_TAG = {10, 2 * CACHE + NARROW}; // also a seek to its back-pointer and back, a refill each
constexpr Cost WALKED_TAG = {12, 6 * NARROW};        // in a seek by scanning: three peeks each way, a seek for each
constexpr Cost AT_END = {5 * REQUEST_TURNS, 0};      // twice the end, position, read, seek past the end
constexpr uint64_t FEW = 100;                        /**< tags that every file has */

/** Moving forward over this many bytes, some of which start false headers, and over a few tags. */
Cost Forward(uint64_t bytes, uint64_t false_headers = 0, uint64_t cache = CACHE)
{
    return Cost{3 * (bytes / (cache - 12) + 2), bytes + 2 * cache + false_headers * (std::min(cache, CACHE) + NARROW)} +
           false_headers * FALSE_HEADER + FEW * WALKED_TAG;
}
/** Moving backward, byte by byte. */
const auto Backward = [](uint64_t bytes, uint64_t read_size = NARROW) {
    return bytes * Cost{4, 2 * std::max(read_size, NARROW)};
};

struct WorkCase {
    const char* name;
    Bytes file;
    uint32_t options;
    uint64_t cache;
    Cost open, play, seek; /**< bounds: of opening, of playing all of it, of one time seek */
    uint64_t scan_read_size = 0;
};

Bytes Repeat(const Bytes& pattern, size_t size)
{
    Bytes out(size);
    for (size_t i = 0; i < size; ++i)
        out[i] = pattern[i % pattern.size()];
    return out;
}

/** Audio whose codec byte is 8, like the tag type: in a run of these bytes, every byte starts a plausible tag. */
WorkCase FalseHeaders(const char* name, uint32_t options, uint64_t cache, Cost pass)
{
    const auto audio = [](uint32_t first_ts) {
        Tags tags;
        for (uint32_t i = 0; i < 20; ++i)
            tags.push_back({8, first_ts + 40 * i, AudioData(8, Noise(200))});
        return File(tags, 4);
    };
    const Bytes file = Concat({audio(0).bytes, Repeat({8}, 600000), audio(0x10000000).body()});
    return {name, file, options, cache, 2 * pass, pass, 2 * pass};
}

WorkCase Tail(const char* name, const Bytes& pattern, size_t size, uint32_t options = 0)
{
    const Bytes file = Concat({MakeChain().bytes, Repeat(pattern, size)});
    const Cost open = Backward(TAIL_CURSORS) + 4 * Forward(2 * MIB);
    return {name, file, options, CACHE, open, Forward(file.size()), Forward(2 * file.size())};
}

/** Bytes in which every fourth position is a back-pointer to a nearby byte, then only audio; repeated several times. */
WorkCase Slide(const char* name, size_t size, uint64_t read_size, size_t times = 1)
{
    const Bytes stretch = Concat({Repeat({0, 0, 0, 15}, size), MakeChain({false, true}).body()});
    const Bytes file = Concat({MakeChain().bytes, Repeat(stretch, times * stretch.size())});
    const Cost pass = Forward(file.size()), back = times * Backward(size + 256, read_size);
    return {name, file, 0, CACHE, back + pass, pass, back + pass + 2 * FEW * Cost{0, 6 * read_size}, read_size};
}

/** Many valid tags. The index, if there is one, points past the end of the file. */
WorkCase ManyTags(const char* name, bool video, size_t size, bool index, Cost tag, uint32_t options = 0)
{
    constexpr uint64_t count = 500;
    const auto beyond = [](auto& times, auto& places) { times = {0, 1, 2}, places = {400, 1e9, 1e9}; };
    Tags tags;
    for (uint32_t i = 0; i < count; ++i) {
        if (video)
            tags.push_back(Screen(2 * i, 20));
        tags.push_back(Pcm(2 * i, size));
    }
    const Bytes file = (index ? IndexedFile(tags, beyond) : File(tags)).bytes;
    const Cost pass = Forward(file.size()) + count * (TAG + tag);
    return {name, file, options, CACHE, 2 * pass, pass, Forward(file.size()) + 2 * count * WALKED_TAG};
}

/**
 * Script data before an ordinary file: it costs a position for every keyframe array. An index in the file is read
 * for its end, its limit and its last time.
 */
WorkCase Metadata(const char* name, const Bytes& head, const Bytes& pattern, uint32_t options = 0)
{
    const Bytes payload = Concat({Amf("'onMetaData"), head, Repeat(pattern, MIB)});
    const Bytes file = Concat({File({{18, 0, payload}}).bytes, MakeChain().body()});
    const Cost pass = Forward(file.size()), script = Forward(2 * payload.size()) + Cost{payload.size() / 8, 0};
    return {name, file, options, CACHE, script + 4 * pass, pass, 3 * pass};
}

std::vector<WorkCase> Cases()
{
    const Bytes keyframes = {3, 0, 9, 'k', 'e', 'y', 'f', 'r', 'a', 'm', 'e', 's'}, endless = {10, 255, 255, 255, 255};
    const Bytes times = Concat({{0, 5, 't', 'i', 'm', 'e', 's'}, endless});
    const Bytes positions = Concat({{0, 13, 'f', 'i', 'l', 'e', 'p', 'o', 's', 'i', 't', 'i', 'o', 'n', 's'}, endless});
    const Bytes numbers = Repeat({0, 0x40, 0, 0, 0, 0, 0, 0, 0}, 9000);
    const Cost in_cache = Forward(700000, 0, BIG_CACHE) + 600000 * FALSE_HEADER;
    return {
        FalseHeaders("false headers", 0, CACHE, Forward(700000, 600000)),
        FalseHeaders("false headers, two readers", SEPARATE, CACHE, Forward(700000, 600000)),
        FalseHeaders("false headers in the cache", 0, BIG_CACHE, in_cache),
        FalseHeaders("false headers, growing", GROWING, CACHE, Forward(700000)),
        Tail("zeros", {0}, 3 * MIB),
        Tail("zeros, growing", {0}, 3 * MIB, GROWING),
        Tail("small distances", {0, 0, 0, 15}, 2 * MIB),
        Slide("slide", 300000, NARROW, 4),
        Slide("slide by reads of a byte", 30000, 1),
        ManyTags("audio alone", false, 100, false, TAG),
        ManyTags("large tags", true, CACHE, false, LARGE_TAG),
        ManyTags("large tags, two readers", true, CACHE, false, LARGE_TAG, SEPARATE),
        ManyTags("index beyond the file", true, 100, true, TAG),
        ManyTags("index beyond the file, two readers", true, CACHE, true, LARGE_TAG, SEPARATE | INDEX),
        Metadata("nesting", {}, endless),
        Metadata("long strings", {}, {12, 0, 0, 16, 0}),
        Metadata("objects", {}, keyframes),
        Metadata("array keys", Concat({keyframes, {3}}), {0, 5, 't', 'i', 'm', 'e', 's', 1, 1}),
        Metadata("endless times, kept", Concat({keyframes, {3}, times}), {5}, INDEX),
        Metadata("endless index", Concat({keyframes, {3}, times, numbers, positions}), {0}),
    };
}

/** The host calls since the last count. */
Cost Taken(FakeHost& host)
{
    const Cost taken = {host.io_calls() + host.calls(HostFn::Eof), host.bytes_read()};
    host.reset_calls();
    return taken;
}
Cost Hold(const char* what, Cost cost, Cost bound)
{
    EXPECT_LE(cost.calls, bound.calls) << what;
    EXPECT_LE(cost.bytes, bound.bytes) << what;
    return cost;
}

void HoldAll(const WorkCase& c)
{
    FakeHost host(c.file);
    Session session(host, {c.options, false, static_cast<uint32_t>(c.cache), static_cast<uint32_t>(c.scan_read_size)});
    ASSERT_TRUE(session.opened());
    Hold("open", Taken(host), c.open);
    const bool growing = (c.options & GROWING) != 0;
    Cost request = Forward(c.file.size(), REQUEST_CHECKS, c.cache); // in any number of turns
    request.calls = std::min(request.calls, MOST_CALLS);
    Cost all;
    const auto is_left = [&] { return __FLV_DMX__fioTell64(session.ctx()->audio_reader) < host.visible(); };
    for (int32_t rc = 0; rc == 0 || (!growing && is_left());) { // a request may use up its checks before the end
        host.reset_calls();
        rc = session.frame(AUDIO).rc;
        all = all + Hold("request", Taken(host), request);
    }
    Hold("play", all, c.play);
    host.reset_calls();
    session.frame(AUDIO);
    Hold("request at the end", Taken(host), growing ? Forward(2 * MIB) : AT_END);
    for (const int32_t time : {100, 700, 0x10000000})
        for (const uint32_t mode : {uint32_t{FLVD_SEEK_FORWARD}, uint32_t{FLVD_SEEK_BACKWARD}}) {
            session.seek(time, mode);
            Hold("seek", Taken(host), c.seek);
        }
}

TEST(Work, StaysWithinItsBoundOnTheWorstFiles)
{
    Sweep sweep;
    for (const WorkCase& c : Cases()) {
        if (!sweep.takes_next())
            continue;
        SCOPED_TRACE(c.name);
        HoldAll(c);
    }
}

// 1 MiB of random bytes between tags, of which about 12,300 start a plausible header when no filter is set: the file is
// large and ends late, so any size and time are plausible.
TEST(Work, CrossesOneMiBOfRandomBytes)
{
    std::mt19937 random(13);
    Bytes bytes(MIB);
    std::generate(bytes.begin(), bytes.end(), [&random] { return static_cast<uint8_t>(random()); });
    constexpr uint32_t LATE = 0xFFFFFFF0, SCRIPT = 0xFFFFF0;
    const Tags frames_before = {g_avc, g_aac, Nalu(0), Raw(20)}, more = {g_meta, Nalu(80), Raw(90), Nalu(LATE)};
    for (const bool streams_known : {false, true}) {
        SCOPED_TRACE(streams_known);
        const Tags before = streams_known ? frames_before : Tags{g_meta};
        const Tags after = streams_known ? more : frames_before + more;
        const Bytes last = File(after + Tags{{18, 0, Bytes(SCRIPT)}}).body();
        FakeHost host(Concat({File(before).bytes, bytes, last}));
        Session session(host);
        ASSERT_TRUE(session.opened());
        EXPECT_EQ(session.ctx()->streams, BOTH);
        EXPECT_EQ(session.ctx()->last_ts, LATE);
        EXPECT_LT(host.io_calls(), MOST_CALLS);
        Frames frames;
        host.reset_calls();
        for (FrameResult got = session.frame(); got.rc == 0; got = session.frame()) {
            EXPECT_LT(host.io_calls(), MOST_CALLS);
            host.reset_calls();
            frames.push_back(got.frame);
        }
        EXPECT_LT(host.io_calls(), MOST_CALLS);
        EXPECT_EQ(frames, File(before + after).frames(BOTH, 0));
    }
}

struct Calls {
    uint64_t reads, seeks, positions, bytes;
};
Calls operator+(const Calls& a, const Calls& b)
{
    return {a.reads + b.reads, a.seeks + b.seeks, a.positions + b.positions, a.bytes + b.bytes};
}

// Opening: the file header and the size of the file; the first three tags in one cache, four position queries each; the
// end of the last tag, and its time, each found through its back-pointer; a rewind.
constexpr Calls HEADER = {1, 2, 1, CACHE}, FIRST_TAGS = {1, 1, 12, CACHE}, LAST_TAG = {2, 2, 1, 4 + NARROW};
constexpr Calls LAST_TIME = {2, 3, 1, 4 + NARROW}, REWIND = {0, 1, 0, 0};
constexpr Calls CHECK = {1, 2, 0, 4}; // of a tag larger than the cache, and the seek back to it

// A seek by scanning: the estimated position and the tag there, then header and back-pointer of each tag on the way.
// Forward, each costs a position query; backward, each costs a seek.
constexpr Calls Walk(uint64_t forward, uint64_t backward)
{
    const uint64_t reads = 3 + 2 * (forward + backward);
    return {reads, 4 + forward + 2 * backward, 4 + 2 * forward + backward, CACHE + NARROW * reads};
}

// A video frame every 40 ms, every twentieth a keyframe.
TEST(Work, CostsLittleOnValidFiles)
{
    const auto opened = [](Session&) {};
    const auto played = [](Session& session) { EXPECT_EQ(play(session).size(), FRAMES); };
    const auto sought = [](Session& session) {
        int32_t reached = 0;
        EXPECT_EQ(session.seek(4200, FLVD_SEEK_BACKWARD, &reached), 0);
        EXPECT_EQ(reached, 4000);
    };
    const Calls opening = HEADER + FIRST_TAGS + LAST_TAG + LAST_TIME + REWIND;
    // Makes the estimate wrong: it points to the tag at 3,280 ms, 38 tags before the keyframe after 4,200 ms, which is
    // 20 tags after the target. The two keyframes on the way are read twice.
    const Bytes long_text = Amf("'x^5000");
    const Calls astray = Walk(38 + 2, 20);
    // If tags are large, the estimate is inside one; from the next, at 4,240 ms, the target is 6 tags back.
    const Calls inside = Calls{BIG / (CACHE - 12) + 1, 0, 0, BIG} + Walk(0, 6);
    // Bytes after the file header: script data and configuration, 95 in all, and the frames.
    const uint64_t tags = FRAMES + 2, tiny = 95 + FRAMES * (TINY + 20), big = 95 + FRAMES * (BIG + 20);
    const struct {
        const char* what;
        size_t size;
        void (*act)(Session&);
        Calls most;
        Bytes script = g_meta.data; // empty: an index
        bool with_open = false;     // the calls of the open count as well
        uint32_t options = 0;
    } rows[] = {
        {.what = "opening: head and tail", .size = TINY, .act = opened, .most = opening, .with_open = true},
        {.what = "opening: large frames", .size = BIG, .act = opened, .most = opening + CHECK, .with_open = true},
        {.what = "small: whole caches", .size = TINY, .act = played, .most = {tiny / CACHE + 1, 1, 2 * tags, tiny}},
        {.what = "large: every byte once", .size = BIG, .act = played, .most = {1 + 2 * FRAMES, 1, 2 * tags, big}},
        {.what = "scanning seek", .size = TINY, .act = sought, .most = astray, .script = long_text},
        {.what = "scanning seek in large frames", .size = BIG, .act = sought, .most = inside},
        {.what = "memory", .size = TINY, .act = sought, .most = {1, 1, 1, CACHE}, .script = {}, .options = INDEX},
        {.what = "index in the file", .size = TINY, .act = sought, .most = {3, 3, 1, 3 * CACHE}, .script = {}},
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(row.what);
        Tags video = {g_avc};
        for (uint32_t i = 0; i < FRAMES; ++i)
            video.push_back({9, 40 * i, AvcNalu(i % 20 == 0, Noise(row.size, i + 1))});
        FakeHost host((row.script.empty() ? IndexedFile(video) : File(Tags{{18, 0, row.script}} + video, 1)).bytes);
        Session session(host, {row.options});
        if (!row.with_open)
            host.reset_calls();
        row.act(session);
        EXPECT_LE(host.calls(HostFn::Read), row.most.reads);
        EXPECT_LE(host.calls(HostFn::Seek), row.most.seeks);
        EXPECT_LE(host.calls(HostFn::Tell), row.most.positions);
        EXPECT_LE(host.bytes_read(), row.most.bytes);
    }
}

} // namespace
