// Work is bounded: the worst files that we can think of, and what each operation costs on them. The bounds are those of
// docs/damage.md, made for the size of each file.

#include "support/report.h"
#include "support/session.h"

using namespace flvd_test;

namespace {

constexpr uint64_t CACHE = 4096, BIG_CACHE = 1u << 20, NARROW = 16; // sizes of reads
constexpr uint64_t MIB = 1u << 20, SEARCH_FALSE_HEADERS = MIB / 64, REQUEST_SEARCHES = 102, TAIL_CURSORS = MIB + 256;

struct Cost {
    uint64_t calls = 0, bytes = 0;
};
Cost operator+(Cost a, Cost b)
{
    return {a.calls + b.calls, a.bytes + b.bytes};
}
Cost operator*(uint64_t n, Cost a)
{
    return {n * a.calls, n * a.bytes};
}

constexpr Cost TAG = {5, 0}, LARGE_TAG = {10, 2 * CACHE + NARROW}, WALKED_TAG = {12, 6 * NARROW};
constexpr uint64_t FEW = 100; /**< tags that every file has */

/** Going forward over so many bytes, of which some begin false headers, and over a few tags. */
Cost Forward(uint64_t bytes, uint64_t false_headers = 0, uint64_t cache = CACHE)
{
    return Cost{3 * (bytes / (cache - 12) + 2) + 6 * false_headers,
                bytes + 2 * cache + false_headers * (std::min(cache, CACHE) + NARROW)} +
           FEW * WALKED_TAG;
}
/** The same, with the false tags fitting the cache. */
Cost ForwardInCache(uint64_t bytes, uint64_t false_headers, uint64_t cache)
{
    return Forward(bytes, 0, cache) + Cost{6 * false_headers, 0};
}
/** Going backward, byte by byte. */
Cost Backward(uint64_t bytes, uint64_t quantum = NARROW)
{
    return bytes * Cost{4, 2 * quantum};
}
/** Script data: a position for every keyframe array. */
Cost Script(uint64_t bytes)
{
    return Forward(2 * bytes) + Cost{bytes / 8, 0};
}

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
Bytes Tags(const Flv& flv)
{
    return {flv.bytes.begin() + 13, flv.bytes.end()};
}

/** Sound whose header byte is 8, the tag type: in a run of it every byte begins a plausible tag. */
Flv Sounds(uint32_t first_ts)
{
    FlvBuilder builder(4);
    for (uint32_t i = 0; i < 20; ++i)
        builder.audio(first_ts + 40 * i, AudioData(8, Noise(200)));
    return builder.build();
}

WorkCase FalseHeaders(const char* name, uint32_t options, uint64_t cache, Cost pass)
{
    const Bytes file = Concat({Sounds(0).bytes, Repeat({8}, 600000), Tags(Sounds(0x10000000))});
    return {name, file, options, cache, 2 * pass, pass, 2 * pass};
}

WorkCase Tail(const char* name, const Bytes& pattern, size_t size, uint32_t options = 0)
{
    const Bytes file = Concat({MakeChain().bytes, Repeat(pattern, size)});
    const Cost halvings = 4 * Forward(2 * MIB);
    return {
        name, file, options, CACHE, Backward(TAIL_CURSORS) + halvings, Forward(file.size()), Forward(2 * file.size())};
}

/** Sound alone at the end, behind bytes whose every fourth place leads back a little. */
WorkCase Slide(const char* name, size_t size, uint64_t quantum)
{
    const Bytes file = Concat({MakeChain().bytes, Repeat({0, 0, 0, 15}, size), Tags(MakeChain({false, true}))});
    const Cost pass = Forward(file.size()), back = Backward(size + 256, quantum);
    return {name, file, 0, CACHE, back + pass, pass, back + pass + 2 * FEW * Cost{0, 6 * quantum}, quantum};
}

/** Many sound tags. The index, when there is one, leads behind the end of the file. */
WorkCase ManyTags(const char* name, bool pictures, size_t size, bool index, Cost tag, uint32_t options = 0)
{
    constexpr uint64_t count = 500;
    FlvBuilder builder;
    if (index)
        builder.indexed_metadata({}, [](auto& times, auto& places) { times = {0, 1, 2}, places = {400, 1e9, 1e9}; });
    for (uint32_t i = 0; i < count; ++i) {
        if (pictures)
            builder.video(2 * i, VideoData(1, CODEC_SCREEN, Noise(20)));
        builder.audio(2 * i, AudioData(SOUND_PCM, Noise(size)));
    }
    const Bytes file = builder.build().bytes;
    const Cost pass = Forward(file.size()) + count * (TAG + tag);
    return {name, file, options, CACHE, 2 * pass, pass, Forward(file.size()) + 2 * count * WALKED_TAG};
}

/** Script data in front of an ordinary file. An index in the file is read for its end, its limit and its last time. */
WorkCase Metadata(const char* name, const Bytes& head, const Bytes& pattern, uint32_t options = 0)
{
    const Bytes payload = Concat({amf::String("onMetaData"), head, Repeat(pattern, MIB)});
    const Bytes file = Concat({FlvBuilder().script(payload).build().bytes, Tags(MakeChain())});
    const Cost pass = Forward(file.size());
    return {name, file, options, CACHE, Script(payload.size()) + 4 * pass, pass, 3 * pass};
}

std::vector<WorkCase> Cases()
{
    const Bytes keyframes = {3, 0, 9, 'k', 'e', 'y', 'f', 'r', 'a', 'm', 'e', 's'}, endless = {10, 255, 255, 255, 255};
    const Bytes times = Concat({{0, 5, 't', 'i', 'm', 'e', 's'}, endless});
    const Bytes positions = Concat({{0, 13, 'f', 'i', 'l', 'e', 'p', 'o', 's', 'i', 't', 'i', 'o', 'n', 's'}, endless});
    const Bytes numbers = Repeat({0, 0x40, 0, 0, 0, 0, 0, 0, 0}, 9000);
    return {
        FalseHeaders("false_headers", 0, CACHE, Forward(700000, 600000)),
        FalseHeaders("false_headers_two_readers", SEPARATE, CACHE, Forward(700000, 600000)),
        FalseHeaders("false_headers_in_cache", 0, BIG_CACHE, ForwardInCache(700000, 600000, BIG_CACHE)),
        FalseHeaders("false_headers_growing", GROWING, CACHE, Forward(700000)),
        Tail("zeros", {0}, 3 * MIB),
        Tail("zeros_growing", {0}, 3 * MIB, GROWING),
        Tail("small_distances", {0, 0, 0, 15}, 2 * MIB),
        Slide("slide", 300000, NARROW),
        Slide("slide_by_wide_reads", 30000, CACHE),
        ManyTags("sound_alone", false, 100, false, TAG),
        ManyTags("large_tags", true, CACHE, false, LARGE_TAG),
        ManyTags("large_tags_two_readers", true, CACHE, false, LARGE_TAG, SEPARATE),
        ManyTags("index_beyond_the_file", true, 100, true, TAG),
        ManyTags("index_beyond_the_file_two_readers", true, CACHE, true, LARGE_TAG, SEPARATE | INDEX),
        Metadata("nesting", {}, endless),
        Metadata("strings", {}, {2, 1, 0}),
        Metadata("long_strings", {}, {12, 0, 0, 16, 0}),
        Metadata("objects", {}, keyframes),
        Metadata("array_keys", Concat({keyframes, {3}}), {0, 5, 't', 'i', 'm', 'e', 's', 1, 1}),
        Metadata("endless_times_kept", Concat({keyframes, {3}, times}), {5}, INDEX),
        Metadata("endless_index", Concat({keyframes, {3}, times, numbers, positions}), {0}),
    };
}

class Work : public testing::TestWithParam<WorkCase> {
protected:
    static Cost taken(const FakeHost& host) { return {host.io_calls() + host.calls(HostFn::Eof), host.bytes_read()}; }
    static void hold(const char* what, Cost cost, Cost bound)
    {
        EXPECT_LE(cost.calls, bound.calls) << what;
        EXPECT_LE(cost.bytes, bound.bytes) << what;
    }
};

TEST_P(Work, StaysWithinItsBound)
{
    const WorkCase& c = GetParam();
    FakeHost host(c.file);
    Session session(host, {c.options, false, static_cast<uint32_t>(c.cache), static_cast<uint32_t>(c.scan_read_size)});
    ASSERT_TRUE(session.opened());
    hold("open", taken(host), c.open);
    const Cost request = REQUEST_SEARCHES * Forward(2 * MIB, SEARCH_FALSE_HEADERS, c.cache);
    Cost all;
    for (int32_t rc = 0; rc == 0;) {
        host.reset_calls();
        rc = session.frame(AUDIO).rc;
        hold("request", taken(host), request);
        all = all + taken(host);
    }
    hold("play", all, c.play);
    for (const int32_t time : {100, 700, 0x10000000})
        for (const uint32_t mode : {uint32_t{FLVD_SEEK_FORWARD}, uint32_t{FLVD_SEEK_BACKWARD}}) {
            host.reset_calls();
            session.seek(time, mode);
            hold("seek", taken(host), c.seek);
        }
}

INSTANTIATE_TEST_SUITE_P(WorstFiles, Work, testing::ValuesIn(Cases()),
                         [](const testing::TestParamInfo<WorkCase>& i) { return std::string(i.param.name); });

} // namespace
