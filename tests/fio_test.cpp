// The cached file and its bit reader by themselves: what they deliver, and which host calls that costs.

#include "support/report.h"

#include <random>

using namespace flvd_test;

namespace {

constexpr uint32_t CACHE = 64;
constexpr uint32_t READ_BINARY = FIO_MODE_READ | FIO_MODE_BINARY;
constexpr uint32_t UPDATE_BINARY = READ_BINARY | FIO_MODE_WRITE;
constexpr uint32_t REFUSED = 0xFFFFFFFF;

// Byte n holds n, so a value tells where it came from.
Bytes Counting(size_t size)
{
    Bytes bytes(size);
    for (size_t i = 0; i < size; ++i)
        bytes[i] = static_cast<uint8_t>(i);
    return bytes;
}

struct OpenArgs {
    uint32_t cache = CACHE;
    uint32_t mode = READ_BINARY;
    int32_t overread = 0;
    uint32_t extra = 0;
};

// An open file with short names for the calls; the log starts behind the opening.
class Cached {
public:
    explicit Cached(FakeHost& host, const OpenArgs& args = {})
    {
        const fio_funcs_t funcs = host.funcs();
        __FLV_DMX__fioSetFunc(&funcs);
        m_file = __FLV_DMX__fioOpen("a.flv", args.mode, args.cache, args.overread, args.extra);
        EXPECT_NE(m_file, nullptr);
        host.start_log();
    }
    ~Cached() { __FLV_DMX__fioClose(m_file); }
    Cached(const Cached&) = delete;
    Cached& operator=(const Cached&) = delete;

    fio_file_t* get() const { return m_file; }
    fio_file_t* operator->() const { return m_file; }
    // The bytes shown in place.
    Bytes peek(uint32_t n) const
    {
        const uint8_t* bytes = nullptr;
        const uint32_t got = __FLV_DMX__fioShowBytesByPtr(&bytes, n, m_file);
        EXPECT_LE(got, n);
        return Bytes(bytes, bytes + got);
    }
    Bytes peek_copy(uint32_t n) const
    {
        Bytes out(n);
        out.resize(__FLV_DMX__fioShowBytesByCopy(out.data(), n, m_file));
        return out;
    }
    uint32_t skip(uint32_t n) const { return __FLV_DMX__fioSkipBytes(n, m_file); }
    // The whole elements read, as bytes.
    Bytes read(uint32_t size, uint32_t count) const
    {
        Bytes out(size_t{size} * count);
        out.resize(size_t{__FLV_DMX__fioRead(out.data(), size, count, m_file)} * size);
        return out;
    }
    uint32_t write(const Bytes& bytes, uint32_t size = 1) const
    {
        return __FLV_DMX__fioWrite(bytes.data(), size, static_cast<uint32_t>(bytes.size()) / size, m_file);
    }
    int32_t seek(int32_t offset, int32_t whence) const { return __FLV_DMX__fioSeek(m_file, offset, whence); }
    int32_t seek64(int64_t offset, int32_t whence) const { return __FLV_DMX__fioSeek64(m_file, offset, whence); }
    int64_t tell() const { return __FLV_DMX__fioTell64(m_file); }
    int32_t eof() const { return __FLV_DMX__fioIsEof(m_file); }

private:
    fio_file_t* m_file;
};

Bytes Part(size_t from, size_t to)
{
    const Bytes all = Counting(to);
    return Bytes(all.begin() + static_cast<std::ptrdiff_t>(from), all.end());
}

TEST(FioOpen, TurnsModeBitsIntoModeStrings)
{
    struct ModeCase {
        uint32_t mode;
        const char* text; // null: refused before the host is asked
    };
    const ModeCase cases[] = {{0x10, "r"},      {0x20, "w"},     {0x21, "w"},     {0x30, "r+"},    {0x31, "w+"},
                              {0x40, "a"},      {0x50, "a+"},    {0x110, "rt"},   {0x210, "rb"},   {0x131, "w+t"},
                              {0x221, "wb"},    {0x230, "r+b"},  {0x150, "a+t"},  {0x240, "ab"},   {0xFC1E, "r"},
                              {0x0, nullptr},   {0x1, nullptr},  {0x11, nullptr}, {0x41, nullptr}, {0x51, nullptr},
                              {0x60, nullptr},  {0x61, nullptr}, {0x70, nullptr}, {0x71, nullptr}, {0x310, nullptr},
                              {0x331, nullptr}, {0x200, nullptr}};
    for (const auto& [mode, text] : cases) {
        SCOPED_TRACE(mode);
        FakeHost host(Counting(10));
        const fio_funcs_t funcs = host.funcs();
        __FLV_DMX__fioSetFunc(&funcs);
        fio_file_t* const file = __FLV_DMX__fioOpen("a.flv", mode, CACHE, 0, 0);
        EXPECT_EQ(file != nullptr, text != nullptr);
        EXPECT_EQ(host.open_modes(), text != nullptr ? std::vector<std::string>{text} : std::vector<std::string>{});
        EXPECT_EQ(__FLV_DMX__fioClose(file), 0);
    }
}

TEST(FioOpen, StartsIdleAndAllocatesTheExtraForOverreadOnly)
{
    for (const int32_t overread : {0, 1}) {
        FakeHost host(Counting(10));
        const fio_funcs_t funcs = host.funcs();
        __FLV_DMX__fioSetFunc(&funcs);
        fio_file_t* const file = __FLV_DMX__fioOpen("a.flv", READ_BINARY, CACHE, overread, 32);
        ASSERT_NE(file, nullptr);
        const uint32_t extra = overread != 0 ? 32 : 0;
        EXPECT_EQ(host.live_bytes(), sizeof(fio_file_t) + CACHE + extra);
        EXPECT_EQ(file->state, FIO_STATE_IDLE);
        EXPECT_EQ(file->overread, overread);
        EXPECT_EQ(file->overread_extra, extra);
        EXPECT_EQ(file->capacity, CACHE);
        EXPECT_EQ(file->read_size, CACHE);
        EXPECT_EQ(file->head + file->count + static_cast<uint32_t>(file->bits_left + file->bit_skip_pending), 0u);
        EXPECT_EQ(file->bits, 0u);
        __FLV_DMX__fioClose(file);
    }
}

TEST(FioOpen, LeavesNothingBehindWhenItFails)
{
    const auto fails = [](FakeHost& host, uint32_t cache, int32_t overread, uint32_t extra) {
        const fio_funcs_t funcs = host.funcs();
        __FLV_DMX__fioSetFunc(&funcs);
        EXPECT_EQ(__FLV_DMX__fioOpen("a.flv", READ_BINARY, cache, overread, extra), nullptr);
        EXPECT_EQ(host.live_blocks(), 0u);
        EXPECT_EQ(host.open_handles(), 0u);
    };
    for (uint64_t call = 1; call <= 3; ++call) { // open, object, cache
        FakeHost host(Counting(10));
        host.fail_nth_call(call);
        fails(host, CACHE, 0, 0);
        EXPECT_EQ(host.calls(HostFn::Alloc), call - 1);
    }
    FakeHost host(Counting(10));
    fails(host, 0xFFFFFFF0, 1, 0x20); // the sum does not fit 32 bits
    EXPECT_EQ(__FLV_DMX__fioClose(nullptr), 0);
    EXPECT_EQ(__FLV_DMX__fiodbgReadBytes(), 0u);
}

TEST(FioPeek, RefillsByTheLargerOfRequestAndQuantum)
{
    FakeHost host(Counting(200));
    const Cached file(host);
    EXPECT_EQ(file.peek(4), Part(0, 4));
    EXPECT_EQ(host.take_log(), "read(64)=64");
    EXPECT_EQ(file.peek(64), Part(0, 64));
    EXPECT_EQ(file.skip(10), 10u);
    EXPECT_EQ(file.peek(54), Part(10, 64)); // at the head, nothing moves
    EXPECT_EQ(file->head, 10u);
    EXPECT_EQ(file.peek_copy(54), Part(10, 64));
    EXPECT_EQ(host.take_log(), "");
    EXPECT_EQ(file.peek(55), Part(10, 65)); // compacted, then filled up
    EXPECT_EQ(file->head, 0u);
    EXPECT_EQ(host.take_log(), "read(10)=10");
    EXPECT_EQ(file.tell(), 10);

    EXPECT_EQ(__FLV_DMX__fioSetCacheReadSize(file.get(), 16), 1);
    file.skip(60);
    host.take_log();
    EXPECT_EQ(file.peek_copy(5), Part(70, 75)); // 4 bytes held, 16 is the least
    EXPECT_EQ(host.take_log(), "read(12)=12");
    EXPECT_EQ(file.peek(20), Part(70, 90)); // more than the quantum
    EXPECT_EQ(host.take_log(), "read(4)=4");

    file.seek(190, FIO_SEEK_SET);
    host.take_log();
    EXPECT_EQ(file.peek(20), Part(190, 200)); // one read, short at the end
    EXPECT_EQ(host.take_log(), "read(20)=10");
    EXPECT_EQ(file.peek(8), Part(190, 198));
    EXPECT_EQ(host.take_log(), "");
}

TEST(FioPeek, IsClampedToTheAllocatedCache)
{
    FakeHost host(Counting(200));
    const Cached file(host);
    EXPECT_EQ(file.peek(65), Part(0, 64));
    file.skip(1);
    EXPECT_EQ(file.peek(UINT32_MAX), Part(1, 65));
    EXPECT_EQ(file.peek_copy(100), Part(1, 65));
    EXPECT_EQ(host.take_log(), "read(64)=64 read(1)=1");
}

TEST(FioPeek, WithOverreadAsksForTheWholeRequestBehindTheCachedBytes)
{
    FakeHost host(Counting(250));
    const Cached file(host, {CACHE, READ_BINARY, 1, 32});
    file.peek(4);
    file.skip(60);
    EXPECT_EQ(file.peek(10), Part(60, 70)); // 64 behind the 4 held
    EXPECT_EQ(host.take_log(), "read(64)=64 read(64)=64");
    EXPECT_EQ(file.peek(100), Part(60, 156)); // clamped to 96; 28 free
    EXPECT_EQ(host.take_log(), "read(28)=28");

    const Cached tight(host, {CACHE, READ_BINARY, 1, 0});
    tight.peek(4);
    tight.skip(60);
    EXPECT_EQ(tight.peek(10), Part(60, 70)); // limited to the free space
    EXPECT_EQ(host.take_log(), "read(64)=64 read(60)=60");
}

TEST(FioSkip, SeeksTheHostForWhatIsNotCached)
{
    FakeHost host(Counting(200));
    const Cached file(host);
    file.peek(1);
    host.take_log();
    EXPECT_EQ(file.skip(64), 64u);
    EXPECT_EQ(file->head, 0u);
    EXPECT_EQ(file->count, 0u);
    EXPECT_EQ(host.take_log(), "");
    file.peek(1);
    EXPECT_EQ(file.skip(100), 100u);
    EXPECT_EQ(host.take_log(), "read(64)=64 seek64(36,1)=0");
    EXPECT_EQ(file.skip(100), 100u); // past the end: the host decides
    EXPECT_EQ(file.tell(), 264);

    file.seek(0, FIO_SEEK_SET);
    file.peek(1);
    host.fail_from(HostFn::Seek, 1);
    EXPECT_EQ(file.skip(100), 64u);
    EXPECT_EQ(file->count, 0u);
}

TEST(FioSeek, StaysInTheCacheOnlyForShortStepsForward)
{
    struct SeekCase {
        int64_t offset;
        int32_t whence;
        int32_t rc;
        const char* host_calls; // 10 of 64 cached bytes are consumed before
        int64_t pos;
    };
    const SeekCase cases[] = {
        {0, FIO_SEEK_CUR, 0, "", 10},
        {53, FIO_SEEK_CUR, 0, "", 63},
        {54, FIO_SEEK_CUR, 0, "(0,1)=0", 64},
        {100, FIO_SEEK_CUR, 0, "(46,1)=0", 110},
        {-1, FIO_SEEK_CUR, 0, "(-55,1)=0", 9},
        {20, FIO_SEEK_SET, 0, "(20,0)=0", 20},
        {-20, FIO_SEEK_END, 0, "(-20,2)=0", 180},
        {20, FIO_SEEK_END, 0, "(20,2)=0", 220},
        {-11, FIO_SEEK_CUR, -1, "(-65,1)=-1", 64}, // failed: the cache is empty all the same
        {-5, FIO_SEEK_SET, -1, "(-5,0)=-1", 64},
        {0, 3, -1, "", 10},
        {0, -1, -1, "", 10},
    };
    for (const SeekCase& c : cases) {
        for (const bool wide : {false, true}) {
            SCOPED_TRACE(testing::Message() << c.offset << " from " << c.whence << (wide ? ", 64 bits" : ""));
            FakeHost host(Counting(200));
            const Cached file(host);
            file.peek(1);
            file.skip(10);
            file->bits = 5;
            file->bits_left = 6;
            host.take_log();
            EXPECT_EQ(wide ? file.seek64(c.offset, c.whence) : file.seek(static_cast<int32_t>(c.offset), c.whence),
                      c.rc);
            const std::string name = *c.host_calls == '\0' ? "" : wide ? "seek64" : "seek";
            EXPECT_EQ(host.take_log(), name + c.host_calls);
            EXPECT_EQ(file.tell(), c.pos);
            EXPECT_EQ(file->state, FIO_STATE_READ);
            EXPECT_EQ(file->bits_left, 0);
            EXPECT_EQ(file->bits, 0u);
        }
    }
}

TEST(FioSeek, HandsWidePositionsToTheWideFunctionsOnly)
{
    constexpr int64_t FAR = 0x180000000;
    FakeHost host;
    host.add_sparse_file("a.flv", FAR + 100, {{FAR, Part(0, 100)}});
    {
        const Cached file(host);
        EXPECT_EQ(file.seek64(FAR + 5, FIO_SEEK_SET), 0);
        EXPECT_EQ(file.peek(4), Part(5, 9));
        EXPECT_EQ(file.skip(3), 3u);
        EXPECT_EQ(file.tell(), FAR + 8);
        EXPECT_EQ(file.seek64(-FAR, FIO_SEEK_CUR), 0);
        EXPECT_EQ(file.tell(), 8);
        EXPECT_EQ(file.skip(0xC0000000), 0xC0000000);
        EXPECT_EQ(file.tell(), 0xC0000008);
    }
    host.use_32_bit_only();
    const Cached file(host);
    EXPECT_EQ(file.seek64(0x100000010, FIO_SEEK_SET), 0); // the low 32 bits
    EXPECT_EQ(file.skip(4), 4u);
    EXPECT_EQ(file.tell(), 20);
    EXPECT_EQ(host.take_log(), "seek(16,0)=0 seek(4,1)=0 tell()=20");
    EXPECT_EQ(file.skip(0xFFFFFFF0), 0u); // as a 32-bit offset it would lead back
    EXPECT_EQ(file.tell(), 20);
    EXPECT_EQ(file.skip(0x7FFFFFF0), 0u);
    host.fail_from(HostFn::Tell, 1);
    EXPECT_EQ(file.tell(), -1); // sign-extended
}

TEST(FioTell, CountsReadAheadAndPendingBytes)
{
    FakeHost host(Counting(200));
    const Cached file(host, {CACHE, UPDATE_BINARY});
    const auto both = [&] {
        const int32_t narrow = __FLV_DMX__fioTell(file.get());
        EXPECT_EQ(file.tell(), narrow);
        return narrow;
    };
    EXPECT_EQ(both(), 0);
    EXPECT_EQ(host.take_log(), "tell()=0 tell64()=0");
    file.peek(10);
    file.skip(3);
    EXPECT_EQ(both(), 3);
    host.fail_from(HostFn::Tell, 1);
    EXPECT_LT(both(), 0);
    host.fail_nothing();
    file.seek(50, FIO_SEEK_SET);
    file.write(Counting(20));
    EXPECT_EQ(both(), 70);
    host.fail_from(HostFn::Tell, 1);
    EXPECT_LT(both(), 0); // pending bytes do not turn a failure into a position
}

TEST(FioIsEof, HoldsOnlyWithAnEmptyCache)
{
    FakeHost host(Counting(10));
    const Cached file(host);
    EXPECT_EQ(file.eof(), 0);
    file.peek(11);
    EXPECT_EQ(file.eof(), 0); // the host is at its end, 10 bytes are cached
    EXPECT_EQ(host.take_log(), "eof()=0 read(64)=10");
    file.skip(10);
    EXPECT_NE(file.eof(), 0);
    file.seek(0, FIO_SEEK_CUR);
    EXPECT_EQ(file.eof(), 0);
}

TEST(FioRead, TakesTheCachedBytesThenTheCheapestWay)
{
    struct ReadCase {
        const char* name;
        uint32_t cached; // bytes made visible before, by a quantum of that size
        uint32_t quantum;
        uint32_t total;
        const char* host_calls;
        uint32_t held;   // cached bytes afterwards
        uint32_t copies; // out of the cache
    };
    const ReadCase cases[] = {
        {"less than cached", 20, 32, 19, "", 1, 1},
        {"all cached", 20, 32, 20, "read(32)=32", 32, 1},
        {"a little more", 20, 32, 25, "read(32)=32", 27, 2},
        {"rest one below the quantum", 20, 32, 51, "read(32)=32", 1, 2},
        {"rest is the quantum", 20, 32, 52, "read(32)=32", 0, 1},
        {"rest above the quantum", 20, 32, 120, "read(100)=100", 0, 1},
        {"nothing cached, small", 0, 32, 5, "read(32)=32", 27, 1},
        {"nothing cached, large", 0, 32, 70, "read(70)=70", 0, 0},
        {"nothing at all", 0, 32, 0, "read(32)=32", 32, 0},
        {"nothing of some", 20, 32, 0, "", 20, 0},
    };
    for (const ReadCase& c : cases) {
        SCOPED_TRACE(c.name);
        FakeHost host(Counting(200));
        const Cached file(host);
        if (c.cached != 0) {
            __FLV_DMX__fioSetCacheReadSize(file.get(), c.cached);
            file.peek(1);
        }
        __FLV_DMX__fioSetCacheReadSize(file.get(), c.quantum);
        file->bits_left = 7;
        host.take_log();
        EXPECT_EQ(file.read(1, c.total), Part(0, c.total));
        EXPECT_EQ(host.take_log(), c.host_calls);
        EXPECT_EQ(host.calls(HostFn::Copy), c.copies);
        EXPECT_EQ(file->count, c.held);
        EXPECT_EQ(file->bits_left, 0);
        EXPECT_EQ(file.tell(), c.total);
        EXPECT_EQ(file.peek(3), Part(c.total, c.total + 3));
    }
}

TEST(FioRead, WithOverreadGoesByQuanta)
{
    struct OverreadCase {
        size_t file_size;
        uint32_t total;
        size_t got;
        const char* host_calls;
    };
    const OverreadCase cases[] = {
        {200, 40, 40, "read(16)=16 read(16)=16 read(16)=16"},
        {200, 32, 32, "read(16)=16 read(16)=16"},
        {200, 16, 16, "read(16)=16"},
        {200, 15, 15, "read(16)=16"},
        {20, 40, 20, "read(16)=16 read(16)=4 read(16)=0"},
        {36, 40, 36, "read(16)=16 read(16)=16 read(16)=4"},
    };
    for (const OverreadCase& c : cases) {
        SCOPED_TRACE(testing::Message() << c.total << " of " << c.file_size);
        FakeHost host(Counting(c.file_size));
        const Cached file(host, {CACHE, READ_BINARY, 1, 16});
        __FLV_DMX__fioSetCacheReadSize(file.get(), 16);
        EXPECT_EQ(file.read(1, c.total), Part(0, c.got));
        EXPECT_EQ(host.take_log(), c.host_calls);
        EXPECT_EQ(file.tell(), static_cast<int64_t>(c.got));
    }
}

TEST(FioRead, CountsWholeElements)
{
    FakeHost host(Counting(10));
    const Cached file(host);
    EXPECT_EQ(file.read(4, 1), Part(0, 4));
    EXPECT_EQ(file.read(4, 5), Part(4, 8)); // 6 bytes were left
    EXPECT_EQ(file.read(1, 1), Bytes{});

    file.seek(2, FIO_SEEK_SET);
    uint8_t byte = 77;
    host.take_log();
    EXPECT_EQ(__FLV_DMX__fioRead(&byte, 0, 5, file.get()), 0u);
    EXPECT_EQ(__FLV_DMX__fioRead(&byte, 0x10000, 0x10000, file.get()), 0u);
    EXPECT_EQ(__FLV_DMX__fioRead(&byte, 3, 0x55555556, file.get()), 0u); // the product wraps to 2
    EXPECT_EQ(__FLV_DMX__fioWrite(&byte, 0, 5, file.get()), 0u);
    EXPECT_EQ(__FLV_DMX__fioWrite(&byte, 0x10000, 0x10000, file.get()), 0u);
    EXPECT_EQ(byte, 77);
    EXPECT_EQ(host.take_log(), "");
    EXPECT_EQ(file.peek(1), Part(2, 3));
}

TEST(FioQuantum, IsBoundedByTheCapacity)
{
    FakeHost host(Counting(10));
    const Cached file(host);
    EXPECT_EQ(__FLV_DMX__fioGetCacheReadSize(file.get()), CACHE);
    EXPECT_EQ(__FLV_DMX__fioSetCacheReadSize(file.get(), CACHE + 1), 0);
    EXPECT_EQ(__FLV_DMX__fioSetCacheReadSize(file.get(), 1), 1);
    EXPECT_EQ(__FLV_DMX__fioSetCacheReadSize(file.get(), UINT32_MAX), 0);
    EXPECT_EQ(__FLV_DMX__fioGetCacheReadSize(file.get()), 1u);
    EXPECT_EQ(__FLV_DMX__fioSetCacheReadSize(file.get(), 0), 1);
    EXPECT_EQ(__FLV_DMX__fioGetCacheReadSize(file.get()), CACHE);
    EXPECT_EQ(host.take_log(), "");
}

TEST(FioHost, ThatClaimsMoreThanAskedIsNotBelieved)
{
    FakeHost host(Counting(200));
    fio_funcs_t funcs = host.funcs();
    const Cached file(host);
    funcs.file_read = [](void*, uint32_t, uint32_t count, void*) { return count + 1000; };
    __FLV_DMX__fioSetFunc(&funcs);
    EXPECT_EQ(file.peek(10).size(), 0u);
    EXPECT_EQ(file.read(1, 150).size(), 0u);
    EXPECT_EQ(file.read(1, 5).size(), 0u);
    EXPECT_EQ(file->head + file->count, 0u);
}

class FioWrite : public testing::Test {
protected:
    FakeHost host;
    static constexpr OpenArgs NEW_FILE = {16, FIO_MODE_READ | FIO_MODE_WRITE | FIO_MODE_TRUNCATE | FIO_MODE_BINARY};
};

TEST_F(FioWrite, CollectsUntilTheCacheWouldBeFull)
{
    const Cached file(host, NEW_FILE);
    EXPECT_EQ(file.write(Part(0, 10)), 10u);
    EXPECT_EQ(file.write(Part(10, 15)), 5u); // 15 of 16
    EXPECT_EQ(host.take_log(), "");
    EXPECT_EQ(file.write(Part(15, 16)), 1u); // 16 would fill it
    EXPECT_EQ(host.take_log(), "write(15)=15");
    EXPECT_EQ(file.write(Part(16, 56), 4), 10u); // straight from the source
    EXPECT_EQ(host.take_log(), "write(1)=1 write(40)=40");
    EXPECT_EQ(file.write(Part(56, 60)), 4u);
    EXPECT_EQ(__FLV_DMX__fioFlush(file.get()), 0);
    EXPECT_EQ(host.take_log(), "write(4)=4 flush()=0");
    EXPECT_EQ(file->state, FIO_STATE_IDLE);
    EXPECT_EQ(__FLV_DMX__fioFlush(file.get()), 0);
    EXPECT_EQ(host.take_log(), "flush()=0");
    EXPECT_EQ(file.write(Part(60, 76)), 16u); // a whole cache does not pass through it
    EXPECT_EQ(host.take_log(), "write(16)=16");
    EXPECT_EQ(host.contents(), Counting(76));
}

TEST_F(FioWrite, KeepsWhatAShortWriteLeft)
{
    const Cached file(host, NEW_FILE);
    file.write(Part(0, 10));
    host.shorten_nth(HostFn::Write, 1, 4);
    EXPECT_EQ(file.write(Part(10, 20)), 0u); // nothing of this call is taken
    EXPECT_EQ(file->head, 4u);
    EXPECT_EQ(file->count, 6u);
    EXPECT_EQ(file.write(Part(10, 19)), 9u); // moved to the front, fits
    EXPECT_EQ(host.take_log(), "write(10)=4");
    __FLV_DMX__fioFlush(file.get());
    EXPECT_EQ(host.contents(), Counting(19));
    host.shorten_nth(HostFn::Write, 3, 10);
    EXPECT_EQ(file.write(Part(0, 40), 4), 2u); // whole elements
    file.write(Part(0, 3));
    host.fail_from(HostFn::Write, 1);
    EXPECT_EQ(__FLV_DMX__fioFlush(file.get()), 0); // not reported; the host's flush is
    EXPECT_EQ(file->count, 0u);
    host.fail_from(HostFn::Flush, 1);
    EXPECT_EQ(__FLV_DMX__fioFlush(file.get()), -1);
}

TEST_F(FioWrite, RefusesPeeksAndSkips)
{
    const Cached file(host, NEW_FILE);
    file.write(Part(0, 10));
    const uint8_t mark = 0;
    const uint8_t* bytes = &mark;
    EXPECT_EQ(__FLV_DMX__fioShowBytesByPtr(&bytes, 4, file.get()), 0u);
    EXPECT_EQ(bytes, &mark);
    EXPECT_EQ(file.peek_copy(4), Bytes{});
    EXPECT_EQ(file.skip(4), REFUSED);
    EXPECT_EQ(file.eof(), 0);
    EXPECT_EQ(file->count, 10u);
    EXPECT_EQ(host.take_log(), "");
}

TEST_F(FioWrite, IsFlushedBeforeReadingSeekingAndClosing)
{
    {
        const Cached file(host, NEW_FILE);
        file.write(Part(0, 10));
        EXPECT_EQ(file.seek(2, FIO_SEEK_SET), 0);
        EXPECT_EQ(host.take_log(), "write(10)=10 flush()=0 seek(2,0)=0");
        EXPECT_EQ(file.peek(3), Part(2, 5));
        file.seek(0, FIO_SEEK_END);
        host.take_log();
        file.write(Part(10, 12));
        EXPECT_EQ(host.take_log(), "flush()=0"); // out of the reading state
        EXPECT_EQ(file.read(1, 5), Bytes{});
        EXPECT_EQ(host.take_log(), "write(2)=2 flush()=0 read(16)=0");
        file.seek(0, FIO_SEEK_SET);
        file.peek(1);
        file.write(Part(12, 14)); // the read-ahead is dropped where the host stands, at the end
    }
    EXPECT_EQ(host.take_log(), "seek(0,0)=0 read(16)=12 flush()=0 write(2)=2 flush()=0 close()=0");
    EXPECT_EQ(host.contents(), Counting(14));
}

// Any order of operations against a plain vector and a position, with hosts that deliver little at a time.
class FioRandom : public testing::TestWithParam<std::tuple<uint32_t, uint32_t, int32_t>> {
protected:
    static constexpr uint32_t FILE_SIZE = 300;

    void SetUp() override
    {
        std::tie(m_cache, m_limit, m_overread) = GetParam();
        m_host.add_file("a.flv", m_model);
        m_host.limit_reads(m_limit);
    }
    uint32_t below(uint32_t n) { return static_cast<uint32_t>(m_random() % n); }
    int64_t left() const { return std::max<int64_t>(static_cast<int64_t>(m_model.size()) - m_pos, 0); }
    // `got` came for a request of n bytes: they are those at the position, and fewer only for a reason.
    void check(const Bytes& got, uint32_t n, uint32_t most)
    {
        const auto from = static_cast<std::ptrdiff_t>(std::min<int64_t>(m_pos, static_cast<int64_t>(m_model.size())));
        const auto size = static_cast<std::ptrdiff_t>(got.size());
        const int64_t wanted = std::min<int64_t>(std::min(n, most), left());
        ASSERT_LE(size, wanted);
        if (m_limit == UINT32_MAX || wanted == 0) {
            ASSERT_EQ(size, wanted);
        } else {
            ASSERT_NE(size, 0);
        }
        ASSERT_EQ(got, Bytes(m_model.begin() + from, m_model.begin() + from + size));
    }
    void peek(const Cached& file)
    {
        const uint32_t n = below(m_cache + 10);
        check(below(2) != 0 ? file.peek(n) : file.peek_copy(n), n, file->capacity + file->overread_extra);
    }
    void read(const Cached& file)
    {
        const uint32_t size = m_limit == UINT32_MAX ? 1 + below(3) : 1;
        const uint32_t count = below(m_cache + 20);
        const uint32_t total = size * count;
        const auto there = static_cast<uint32_t>(std::min<int64_t>(total, left()));
        const Bytes got = file.read(size, count);
        check(got, there / size * size, UINT32_MAX);
        m_pos += size == 1 ? static_cast<int64_t>(got.size()) : there; // a part of an element is consumed too
    }
    void skip(const Cached& file)
    {
        const uint32_t n = below(m_cache * 2);
        ASSERT_EQ(file.skip(n), n);
        m_pos += n;
    }
    void seek(const Cached& file)
    {
        const auto target = static_cast<int64_t>(below(FILE_SIZE + 20));
        const int64_t bases[] = {0, m_pos, static_cast<int64_t>(m_model.size())};
        const auto whence = static_cast<int32_t>(below(3));
        const int64_t offset = target - bases[whence];
        ASSERT_EQ(below(2) != 0 ? file.seek64(offset, whence) : file.seek(static_cast<int32_t>(offset), whence), 0);
        m_pos = target;
    }
    void write(const Cached& file)
    {
        // Going over to writing drops the read-ahead and leaves the host where it is: seek as one that empties the
        // cache.
        m_pos = static_cast<int64_t>(below(FILE_SIZE + 20));
        ASSERT_EQ(file.seek64(m_pos, FIO_SEEK_SET), 0);
        const Bytes bytes = Noise(below(m_cache * 2), below(1000));
        ASSERT_EQ(file.write(bytes), bytes.size());
        if (!bytes.empty() && m_model.size() < static_cast<size_t>(m_pos) + bytes.size())
            m_model.resize(static_cast<size_t>(m_pos) + bytes.size());
        std::copy(bytes.begin(), bytes.end(), m_model.begin() + static_cast<std::ptrdiff_t>(m_pos));
        m_pos += static_cast<int64_t>(bytes.size());
    }
    void step(const Cached& file)
    {
        const bool writing = file->state == FIO_STATE_WRITE;
        switch (below(8)) {
        case 0:
        case 1:
            return writing ? read(file) : peek(file);
        case 2:
        case 3:
            return read(file);
        case 4:
            return writing ? seek(file) : skip(file);
        case 5:
            return seek(file);
        case 6:
            return write(file);
        default:
            EXPECT_EQ(__FLV_DMX__fioSetCacheReadSize(file.get(), below(m_cache + 1)), 1);
        }
    }

    FakeHost m_host;
    std::mt19937 m_random{7};
    Bytes m_model = Noise(FILE_SIZE);
    int64_t m_pos = 0;
    uint32_t m_cache = 0;
    uint32_t m_limit = 0;
    int32_t m_overread = 0;
};

TEST_P(FioRandom, AgreesWithAPlainVector)
{
    {
        const Cached file(m_host, {m_cache, UPDATE_BINARY, m_overread, m_cache / 2});
        for (int i = 0; i < 3000; ++i) {
            SCOPED_TRACE(i);
            step(file);
            ASSERT_EQ(file.tell(), m_pos);
            ASSERT_LE(file->head + file->count, file->capacity + file->overread_extra);
            ASSERT_TRUE(file.eof() == 0 || left() == 0);
            ASSERT_FALSE(HasFailure());
        }
    }
    EXPECT_EQ(m_host.contents(), m_model);
}

INSTANTIATE_TEST_SUITE_P(CachesAndHosts, FioRandom,
                         testing::Combine(testing::Values(1u, 7u, 64u), testing::Values(UINT32_MAX, 1u, 5u, 16u),
                                          testing::Values(0, 1)));

TEST(BitReader, ReadsAFileHeader)
{
    FakeHost host(Concat({{0x46, 0x4C, 0x56, 0x01, 0x05, 0, 0, 0, 9, 0, 0, 0, 0}, Noise(60)}));
    const Cached file(host);
    EXPECT_EQ(__FLV_DMX__bitInit(file.get()), 1);
    EXPECT_EQ(file.tell(), 0);
    EXPECT_EQ(__FLV_DMX__bitShowUBits(file.get(), 24), 0x464C56u);
    EXPECT_EQ(__FLV_DMX__bitShowUBits(file.get(), 0), 0u);
    __FLV_DMX__bitSkipBits(file.get(), 32);
    EXPECT_EQ(file.tell(), 4);
    EXPECT_GT(file->bits_left, 32);
    EXPECT_EQ(__FLV_DMX__bitGetUBits(file.get(), 8), 5u);
    EXPECT_EQ(file.tell(), 5);
    EXPECT_EQ(__FLV_DMX__bitGetUBits(file.get(), 32), 9u);
    EXPECT_EQ(file.tell(), 9);
    EXPECT_EQ(host.calls(HostFn::Read), 1u);
}

TEST(BitReader, CountsAByteAsConsumedWithItsFirstBit)
{
    FakeHost host(Bytes{0xF5, 0xA0, 0x80, 0xFF, 0xFF, 0xFF, 0xF0, 0, 0, 0});
    const Cached file(host);
    __FLV_DMX__bitInit(file.get());
    EXPECT_EQ(__FLV_DMX__bitShowSBits(file.get(), 4), 15u); // no sign
    EXPECT_EQ(__FLV_DMX__bitGetSBits(file.get(), 4), 15u);
    EXPECT_EQ(file.tell(), 1);
    EXPECT_EQ(__FLV_DMX__bitShowBit(file.get()), 0u);
    EXPECT_EQ(__FLV_DMX__bitGetBit(file.get()), 0u);
    EXPECT_EQ(__FLV_DMX__bitGetUBits(file.get(), 3), 5u);
    EXPECT_EQ(file.tell(), 1);
    EXPECT_EQ(__FLV_DMX__bitGetBit(file.get()), 1u);
    EXPECT_EQ(file.tell(), 2);

    const struct {
        uint32_t bits;
        int32_t pos;
        uint32_t next;
    } cases[] = {{40, 5, 0xFF}, {44, 6, 0xFF}, {52, 7, 0x00}, {33, 5, 0xFF}, {64, 8, 0}, {32, 4, 0xFF}};
    for (const auto& c : cases) {
        SCOPED_TRACE(c.bits);
        file.seek(0, FIO_SEEK_SET);
        __FLV_DMX__bitInit(file.get());
        __FLV_DMX__bitSkipBitsLong(file.get(), c.bits);
        EXPECT_EQ(file.tell(), c.pos);
        EXPECT_EQ(__FLV_DMX__bitShowUBits(file.get(), 8), c.next);
    }
}

TEST(BitReader, IsEmptiedByByteLevelAccess)
{
    FakeHost host(Counting(200));
    const Cached file(host);
    Bytes buffer(4);
    const std::function<void()> accesses[] = {[&] { file.skip(1); }, [&] { file.read(1, 2); },
                                              [&] { file.seek(20, FIO_SEEK_SET); }, [&] { file.seek(0, 7); },
                                              [&] { __FLV_DMX__fioFlush(file.get()); }};
    for (const auto& access : accesses) {
        __FLV_DMX__bitInit(file.get());
        __FLV_DMX__bitSkipBits(file.get(), 8 * 7);
        file.peek(20);
        EXPECT_NE(file->bits_left, 0);
        access();
        EXPECT_EQ(file->bits_left, 0);
        EXPECT_EQ(file->bits, 0u);
        EXPECT_EQ(file->bit_skip_pending, 0);
        // The bytes are consumed, the reader stays empty.
        const int64_t before = file.tell();
        EXPECT_EQ(__FLV_DMX__bitGetUBits(file.get(), 32), 0u);
        EXPECT_EQ(file.tell(), before + 4);
        EXPECT_EQ(__FLV_DMX__bitGetUBits(file.get(), 9), 0u);
        EXPECT_EQ(file.tell(), before + 6);
        EXPECT_EQ(__FLV_DMX__bitGetBit(file.get()), 0u);
        EXPECT_EQ(file.tell(), before + 7);
        EXPECT_EQ(file->bits_left, 0);
        EXPECT_EQ(file->bits, 0u);
        __FLV_DMX__bitSkipBitsLong(file.get(), 44); // starts it again
        EXPECT_EQ(file.tell(), before + 13);
        EXPECT_EQ(file->bits_left, 60);
        file.seek(0, FIO_SEEK_SET);
    }
}

TEST(BitReader, AnnouncesItsOwnSkips)
{
    FakeHost host(Counting(200));
    const Cached file(host);
    __FLV_DMX__bitInit(file.get());
    const uint64_t bits = file->bits;
    file->bit_skip_pending = 1;
    EXPECT_EQ(file.skip(1), 1u);
    EXPECT_EQ(file->bit_skip_pending, 0);
    EXPECT_EQ(file->bits, bits);
    EXPECT_EQ(file->bits_left, 64);
}

TEST(BitReader, AgreesWithPlainBits)
{
    const Bytes data = Noise(120);
    const auto bits_at = [&](int64_t at, uint32_t n) {
        uint32_t value = 0;
        for (int64_t i = at; i < at + n; ++i) {
            const auto byte = static_cast<size_t>(i / 8);
            value = value << 1 | (byte < data.size() ? uint32_t{data[byte]} >> (7 - i % 8) & 1u : 0u);
        }
        return value;
    };
    std::mt19937 random(3);
    for (const uint32_t cache : {8u, 13u, 4096u}) {
        FakeHost host(data);
        const Cached file(host, {cache});
        for (int round = 0; round < 200; ++round) {
            int64_t at = static_cast<int64_t>(random() % 124) * 8;
            file.seek(static_cast<int32_t>(at / 8), FIO_SEEK_SET);
            __FLV_DMX__bitInit(file.get());
            for (int i = 0; i < 30; ++i) {
                const auto n = static_cast<uint32_t>(random() % 33);
                const auto many = static_cast<uint32_t>(random() % 90);
                uint32_t used = n;
                ASSERT_EQ(__FLV_DMX__bitShowUBits(file.get(), n), bits_at(at, n));
                switch (random() % 5) {
                case 0:
                    ASSERT_EQ(__FLV_DMX__bitGetUBits(file.get(), n), bits_at(at, n));
                    break;
                case 1:
                    __FLV_DMX__bitSkipBits(file.get(), n);
                    break;
                case 2:
                    __FLV_DMX__bitSkipBitsLong(file.get(), many);
                    used = many;
                    break;
                case 3:
                    file.peek(3);
                    used = 0;
                    break;
                default:
                    ASSERT_EQ(__FLV_DMX__bitGetBit(file.get()), bits_at(at, 1));
                    used = 1;
                }
                at += used;
                ASSERT_EQ(file.tell(), (at + 7) / 8);
                ASSERT_GT(file->bits_left, 32);
            }
        }
    }
}

} // namespace
