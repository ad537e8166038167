// What the sound case costs: host calls and bytes do not vary, so they are held as they are.

#include "support/report.h"
#include "support/session.h"

using namespace flvd_test;

namespace {

struct Calls {
    uint64_t reads = 0, seeks = 0, tells = 0, bytes = 0;
};
bool operator==(const Calls& a, const Calls& b)
{
    return a.reads == b.reads && a.seeks == b.seeks && a.tells == b.tells && a.bytes == b.bytes;
}
void PrintTo(const Calls& calls, std::ostream* out)
{
    *out << calls.reads << " reads, " << calls.seeks << " seeks, " << calls.tells << " tells, " << calls.bytes
         << " bytes";
}

constexpr uint64_t CACHE = 4096;
constexpr uint32_t LARGE = 10000; // payload of a tag that the cache does not hold
constexpr uint32_t FRAMES = 200, SMALL = 80;

/** Counts what the host was asked for since the last count. */
Calls Count(FakeHost& host)
{
    const Calls calls = {host.calls(HostFn::Read), host.calls(HostFn::Seek), host.calls(HostFn::Tell),
                         host.bytes_read()};
    host.reset_calls();
    return calls;
}

Flv Pictures(size_t size, bool index)
{
    FlvBuilder builder(1);
    if (index)
        builder.indexed_metadata({});
    else
        builder.add(g_meta);
    builder.add(g_avc);
    for (uint32_t i = 0; i < FRAMES; ++i)
        builder.add({9, 40 * i, AvcNalu(i % 20 == 0, Noise(size, i + 1))});
    return builder.build();
}

} // namespace

TEST(Cost, SmallFramesTakeWholeCachesAndTwoPositions)
{
    const Flv flv = Pictures(SMALL, false);
    FakeHost host(flv.bytes);
    Session session(host);
    Count(host);
    ASSERT_EQ(play(session).size(), FRAMES);
    const Calls calls = Count(host);
    EXPECT_LE(calls.bytes, flv.bytes.size());
    EXPECT_LE(calls.reads, flv.bytes.size() / (CACHE - SMALL - 20) + 3); // a tag that is cut by the cache is kept
    EXPECT_LE(calls.tells, 2 * (FRAMES + 1) + 1 + 2);                    // the configuration, and the end
    EXPECT_LE(calls.seeks, 1u);
}

TEST(Cost, LargeFrameIsLookedBehindOnce)
{
    FakeHost host(Pictures(LARGE, false).bytes);
    Session session(host);
    session.frame();
    for (int i = 0; i < 3; ++i) {
        Count(host);
        ASSERT_EQ(session.frame().frame.data.size(), LARGE);
        const Calls calls = Count(host);
        EXPECT_EQ(calls, (Calls{4, 2, 2, calls.bytes}));
        EXPECT_LE(calls.bytes, LARGE + CACHE + 21);
    }
}

TEST(Cost, OpeningReadsHeadAndTail)
{
    for (const size_t size : {size_t{SMALL}, size_t{LARGE}}) {
        FakeHost host(Pictures(size, false).bytes);
        const Session session(host);
        const Calls calls = Count(host);
        EXPECT_LE(calls.reads, 10u);
        EXPECT_LE(calls.bytes, 3 * CACHE);
    }
}

TEST(Cost, SeekByIndexReadsWhereItLeads)
{
    const Flv flv = Pictures(SMALL, true);
    const std::pair<uint32_t, Calls> costs[] = {{INDEX, {1, 1, 1, CACHE}}, {0, {3, 3, 1, 3 * CACHE}}};
    for (const auto& [options, most] : costs) {
        SCOPED_TRACE(options);
        FakeHost host(flv.bytes);
        Session session(host, {options});
        Count(host);
        int32_t reached = 0;
        ASSERT_EQ(session.seek(4200, FLVD_SEEK_BACKWARD, &reached), 0);
        EXPECT_EQ(reached, 4000);
        const Calls calls = Count(host);
        EXPECT_EQ(calls, (Calls{most.reads, most.seeks, most.tells, calls.bytes}));
        EXPECT_LE(calls.bytes, most.bytes);
    }
}
