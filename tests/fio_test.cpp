// The cached file and its bit reader by themselves: what they deliver, and which host calls that costs.

#include "support/report.h"

using namespace flvd_test;

namespace {

constexpr uint32_t CACHE = 64;
constexpr uint32_t UPDATE_BINARY = FIO_MODE_READ | FIO_MODE_WRITE | FIO_MODE_BINARY;

// Byte n of most files holds n, so a value tells where it came from.
Bytes Part(size_t from, size_t to)
{
    Bytes bytes;
    while (from < to)
        bytes.push_back(static_cast<uint8_t>(from++));
    return bytes;
}

constexpr ReaderOptions UPDATE = {CACHE, 0, 0, UPDATE_BINARY}, OVERREAD = {CACHE, 1, 16};
constexpr ReaderOptions NEW_FILE = {16, 0, 0, UPDATE_BINARY | FIO_MODE_TRUNCATE};

// A host with an open file, and short names for the calls; the log starts after the opening.
class Cached {
public:
    explicit Cached(const ReaderOptions& options = UPDATE, Bytes contents = Part(0, 200))
        : host(std::move(contents)), file(host.open_reader(options))
    {
        host.start_log();
    }
    ~Cached() { close(); }

    // The bytes shown in place.
    Bytes peek(uint32_t n) const
    {
        const uint8_t* bytes = nullptr;
        const uint32_t got = __FLV_DMX__fioShowBytesByPtr(&bytes, n, file);
        EXPECT_EQ(bytes == nullptr, file->state == FIO_STATE_WRITE); // untouched when refused
        return Bytes(bytes, bytes + got);
    }
    // The whole elements read, as bytes.
    Bytes read(uint32_t count, uint32_t size = 1) const
    {
        Bytes out(size_t{size} * count);
        out.resize(size_t{__FLV_DMX__fioRead(out.data(), size, count, file)} * size);
        return out;
    }
    uint32_t write(const Bytes& bytes, uint32_t size = 1) const
    {
        return __FLV_DMX__fioWrite(bytes.data(), size, static_cast<uint32_t>(bytes.size()) / size, file);
    }
    uint32_t skip(uint32_t n) const { return __FLV_DMX__fioSkipBytes(n, file); }
    int32_t seek(int64_t to, int32_t whence = FIO_SEEK_SET) const { return __FLV_DMX__fioSeek64(file, to, whence); }
    int64_t tell() const { return __FLV_DMX__fioTell64(file); }
    int32_t flush() const { return __FLV_DMX__fioFlush(file); }
    int32_t read_size(uint32_t size) const { return __FLV_DMX__fioSetCacheReadSize(file, size); }
    int32_t close() { return __FLV_DMX__fioClose(std::exchange(file, nullptr)); }

    // Where the bytes came from, or the number returned, and the host calls since the last time.
    std::string told(const Bytes& got)
    {
        const size_t from = got.empty() ? 0 : got.front();
        EXPECT_EQ(got, Part(from, from + got.size()));
        return std::to_string(from) + ".." + told(static_cast<int64_t>(from + got.size()));
    }
    std::string told(int64_t result) { return std::to_string(result) + ": " + host.take_log(); }

    FakeHost host;
    fio_file_t* file;
};

TEST(FioOpen, TurnsModeBitsIntoModeStrings)
{
    // Empty: refused before the host is asked.
    const std::pair<uint32_t, const char*> cases[] = {
        {0x10, "r"},   {0x20, "w"},   {0x21, "w"},    {0x30, "r+"},  {0x31, "w+"},   {0x40, "a"},    {0x50, "a+"},
        {0x110, "rt"}, {0x210, "rb"}, {0x131, "w+t"}, {0x221, "wb"}, {0x230, "r+b"}, {0x150, "a+t"}, {0x240, "ab"},
        {0xFC1E, "r"}, {0x0, ""},     {0x1, ""},      {0x11, ""},    {0x41, ""},     {0x51, ""},     {0x60, ""},
        {0x61, ""},    {0x70, ""},    {0x71, ""},     {0x310, ""},   {0x331, ""},    {0x200, ""}};
    for (const auto& [mode, text] : cases) {
        FakeHost host(Part(0, 10));
        host.start_log();
        EXPECT_EQ(__FLV_DMX__fioClose(host.open_reader({CACHE, 0, 0, mode})), 0);
        EXPECT_EQ(host.take_log(), *text != '\0' ? "open(a.flv," + std::string(text) + ")=1 close()=0" : "") << mode;
    }
}

TEST(FioOpen, TakesTheExtraWithOverreadOnly)
{
    for (const uint32_t extra : {0u, 32u}) {
        const Cached f({CACHE, extra != 0 ? 1 : 0, 32});
        EXPECT_EQ(f.host.size_of(f.file->cache), CACHE + extra);
        EXPECT_EQ(f.file->overread_extra, extra);
    }
    FakeHost host(Part(0, 10));
    EXPECT_EQ(host.open_reader({0xFFFFFFF0, 1, 0x20}), nullptr); // the sum does not fit 32 bits
}

TEST(FioPeek, RefillsByTheLargerOfRequestAndReadSize)
{
    Cached f;
    EXPECT_EQ(f.told(f.peek(4)), "0..4: read(64)=64");
    f.skip(10);
    EXPECT_EQ(f.told(f.peek(55)), "10..65: read(10)=10"); // moved to the front, then filled up
    for (const uint32_t size : {CACHE + 1, CACHE, 16u})
        EXPECT_EQ(f.read_size(size), size <= CACHE ? 1 : 0);
    f.skip(60);
    EXPECT_EQ(f.told(f.peek(5)), "70..75: read(12)=12"); // 4 bytes held, 16 is the least
    f.seek(190);
    EXPECT_EQ(f.told(f.peek(20)), "190..200: seek64(190,0)=0 read(20)=10"); // once, though it was short
    EXPECT_EQ(f.told(__FLV_DMX__fioIsEof(f.file)), "0: ");
    f.skip(10);
    EXPECT_EQ(f.told(__FLV_DMX__fioIsEof(f.file)), "1: eof()=1");

    Cached over({CACHE, 1, 32}); // asks for the whole request after the cached bytes
    over.peek(60);
    over.skip(60);
    EXPECT_EQ(over.told(over.peek(10)), "60..70: read(64)=64 read(64)=64");
    EXPECT_EQ(over.told(over.peek(100)), "60..156: read(28)=28"); // clamped to 96; 28 free
}

TEST(FioSeek, StaysInTheCacheOnlyForShortStepsForward)
{
    Cached f;
    f.peek(1);
    EXPECT_EQ(f.told(f.seek(63, FIO_SEEK_CUR)), "0: read(64)=64");
    EXPECT_EQ(f.told(f.seek(1, FIO_SEEK_CUR)), "0: seek64(0,1)=0"); // to the end of the cached bytes
    f.peek(1);
    EXPECT_EQ(f.seek(0, 3), -1); // nothing is lost
    EXPECT_EQ(f.told(__FLV_DMX__fioSeek(f.file, -65, FIO_SEEK_CUR)), "-1: read(64)=64 seek(-129,1)=-1");
    EXPECT_EQ(f.tell(), 128); // failed: the cache is empty all the same
    f.seek(0);
    f.peek(1);
    EXPECT_EQ(f.told(f.skip(64)), "64: tell64()=128 seek64(0,0)=0 read(64)=64"); // a skip may go to the end
    f.peek(1);
    f.host.fail_from(HostFn::Seek, 1);
    EXPECT_EQ(f.told(f.skip(100)), "64: read(64)=64 seek64(36,1)=-1");
    EXPECT_EQ(f.file->count, 0u);
}

TEST(FioSeek, HandsWidePositionsToTheWideFunctionsOnly)
{
    Cached f;
    EXPECT_EQ(f.told(f.seek(0x180000000)), "0: seek64(6442450944,0)=0");
    EXPECT_EQ(f.skip(0xC0000000), 0xC0000000);
    EXPECT_EQ(f.seek(-0x180000000, FIO_SEEK_CUR), 0);
    EXPECT_EQ(f.tell(), 0xC0000000);
    constexpr int64_t most = int64_t{1} << 62; // that a position can be
    for (const int64_t position : {most, most + 1}) {
        EXPECT_EQ(f.seek(position), 0);
        EXPECT_EQ(f.tell(), position <= most ? position : -1);
    }
    f.seek(0xC0000000);
    f.host.use_32_bit_only();
    const fio_funcs_t narrow = f.host.funcs();
    __FLV_DMX__fioSetFunc(&narrow);
    f.host.take_log();
    EXPECT_EQ(f.told(f.seek(0x100000010)), "0: seek(16,0)=0"); // the low 32 bits
    EXPECT_EQ(f.told(f.skip(4)), "4: seek(4,1)=0");
    EXPECT_EQ(f.told(f.skip(0xFFFFFFF0)), "0: "); // as a 32-bit offset it would lead back
    EXPECT_EQ(f.told(f.skip(0x7FFFFFF0)), "0: seek(2147483632,1)=-1");
    EXPECT_EQ(f.told(f.tell()), "20: tell()=20");
}

TEST(FioTell, ReturnsAFailedQueryLessTheReadAhead)
{
    const struct {
        const char* state;
        void (*enter)(const Cached&);
        int64_t told;
    } rows[] = {
        {.state = "idle", .enter = [](const Cached&) {}, .told = -1},
        {.state = "64 bytes read ahead", .enter = [](const Cached& f) { f.peek(1); }, .told = -1 - 64},
        {.state = "40 of them left", .enter = [](const Cached& f) { f.peek(1), f.skip(24); }, .told = -1 - 40},
        {.state = "all consumed", .enter = [](const Cached& f) { f.peek(1), f.skip(64); }, .told = -1},
        {.state = "10 bytes pending", .enter = [](const Cached& f) { f.write(Part(0, 10)); }, .told = -1},
    };
    for (const auto& row : rows) {
        Cached f;
        row.enter(f);
        f.host.fail_from(HostFn::Tell, 1);
        EXPECT_EQ(f.tell(), row.told) << row.state;
        EXPECT_EQ(__FLV_DMX__fioTell(f.file), row.told) << row.state;
    }
}

TEST(FioRead, TakesTheCachedBytesThenTheCheapestWay)
{
    const struct {
        ReaderOptions open;
        uint32_t total; // to read
        const char* told;
        uint32_t held = 0;   // cached bytes afterwards
        int64_t from = 0;    // place
        uint32_t cached = 0; // made visible before, with that read size, which then is 16
        uint64_t copies = 1; // out of the cache
    } rows[] = {
        {.open = UPDATE, .total = 19, .told = "0..19: ", .held = 1, .cached = 20},
        {.open = UPDATE, .total = 35, .told = "0..35: read(16)=16", .held = 1, .cached = 20, .copies = 2},
        // The rest is as large as a read: straight to the destination.
        {.open = UPDATE, .total = 36, .told = "0..36: read(16)=16", .cached = 20},
        {.open = UPDATE, .total = 0, .told = "0..0: read(16)=16", .held = 16, .copies = 0},
        {.open = OVERREAD, .total = 15, .told = "0..15: read(16)=16", .held = 1},
        // The last read goes through the cache.
        {.open = OVERREAD, .total = 32, .told = "0..32: read(16)=16 read(16)=16"},
        {.open = OVERREAD, .total = 40, .told = "164..200: read(16)=16 read(16)=16 read(16)=4", .from = 164},
        {.open = OVERREAD,
         .total = 40,
         .told = "180..200: read(16)=16 read(16)=4 read(16)=0",
         .from = 180,
         .copies = 0},
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(row.told);
        Cached f(row.open);
        f.seek(row.from);
        f.read_size(row.cached);
        f.peek(row.cached);
        f.read_size(16);
        f.host.take_log();
        EXPECT_EQ(f.told(f.read(row.total)), row.told);
        EXPECT_EQ(f.file->count, row.held);
        EXPECT_EQ(f.host.calls(HostFn::Copy), row.copies);
    }
}

TEST(FioRead, CountsWholeElementsAndRejectsCountsThatAreTooLarge)
{
    Cached f(UPDATE, Part(0, 10));
    EXPECT_EQ(f.read(1, 4), Part(0, 4));
    EXPECT_EQ(f.read(5, 4), Part(4, 8)); // 6 bytes were left
    __FLV_DMX__fiodbgReset();
    EXPECT_EQ(__FLV_DMX__fiodbgReadBytes(), 0u); // this build counts nothing
    f.seek(2);
    uint8_t byte = 77;
    f.host.take_log();
    const std::pair<uint32_t, uint32_t> refused[] = {{0, 5}, {0x10000, 0x10000}, {3, 0x55555556}}; // 2 with 32 bits
    for (const auto& [size, count] : refused) {
        EXPECT_EQ(__FLV_DMX__fioRead(&byte, size, count, f.file), 0u);
        EXPECT_EQ(__FLV_DMX__fioWrite(&byte, size, count, f.file), 0u);
    }
    EXPECT_EQ(byte, 77);
    EXPECT_EQ(f.told(f.peek(1)), "2..3: read(64)=8");
    EXPECT_EQ(__FLV_DMX__fioShowBytesByCopy(&byte, 1, f.file), 1u);
    EXPECT_EQ(byte, 2);

    fio_funcs_t boaster = f.host.funcs(); // claims more than it was asked for
    boaster.file_read = [](void*, uint32_t, uint32_t count, void*) { return count + 1000; };
    boaster.file_write = [](const void*, uint32_t, uint32_t count, void*) { return count + 7; };
    boaster.file_tell = [](void*) { return INT32_MIN; };
    __FLV_DMX__fioSetFunc(&boaster);
    EXPECT_LT(__FLV_DMX__fioTell(f.file), 0); // the read-ahead does not make it a position
    f.seek(0);
    EXPECT_EQ(f.peek(10), Bytes());
    EXPECT_EQ(f.read(150), Bytes());
    EXPECT_EQ(f.read(5), Bytes());
    EXPECT_EQ(f.file->count, 0u);
    f.write(Part(0, 10));
    EXPECT_EQ(__FLV_DMX__fioWrite(&byte, 1, 0xFFFFFFF8, f.file), 0xFFFFFFF8); // no room for all, though the sum wraps
}

TEST(FioWrite, CollectsUntilTheCacheWouldBeFull)
{
    Cached f(NEW_FILE);
    EXPECT_EQ(f.told(f.write(Part(0, 15))), "15: "); // of 16
    EXPECT_EQ(f.told(f.write(Part(15, 16))), "1: write(15)=15");
    EXPECT_EQ(f.told(f.write(Part(16, 56), 4)), "10: write(1)=1 write(40)=40"); // straight from the source
    EXPECT_EQ(f.told(f.write(Part(56, 72))), "16: write(16)=16");               // as a whole cache
    f.write(Part(72, 76));
    EXPECT_EQ(f.peek(4), Bytes{}); // no way to the bytes after them
    uint8_t byte = 0;
    EXPECT_EQ(__FLV_DMX__fioShowBytesByCopy(&byte, 1, f.file), 0u);
    EXPECT_EQ(f.skip(4), 0xFFFFFFFF);
    EXPECT_EQ(__FLV_DMX__fioIsEof(f.file), 0);
    EXPECT_EQ(f.told(f.flush()), "0: write(4)=4 flush()=0");
    EXPECT_EQ(f.told(f.flush()), "0: flush()=0");
}

TEST(FioWrite, IsFlushedBeforeReadingSeekingAndClosing)
{
    Cached f(NEW_FILE);
    f.write(Part(0, 10));
    EXPECT_EQ(f.told(f.seek(2)), "0: write(10)=10 flush()=0 seek64(2,0)=0");
    EXPECT_EQ(f.told(f.peek(3)), "2..5: read(16)=8");
    EXPECT_EQ(f.told(f.write(Part(10, 12))), "2: flush()=0"); // drops the read-ahead where the host stands
    EXPECT_EQ(f.told(f.read(5)), "0..0: write(2)=2 flush()=0 read(16)=0");
    f.write(Part(12, 14));
    EXPECT_EQ(f.told(f.close()), "0: flush()=0 write(2)=2 flush()=0 close()=0");
    EXPECT_EQ(f.host.contents(), Part(0, 14));
}

TEST(FioWrite, KeepsWhatAShortWriteLeft)
{
    Cached f(NEW_FILE);
    f.write(Part(0, 10));
    f.host.shorten_nth(HostFn::Write, 1, 4);
    EXPECT_EQ(f.told(f.write(Part(10, 20))), "0: write(10)=4"); // nothing of this call is taken
    EXPECT_EQ(f.told(f.write(Part(10, 19))), "9: ");            // after the 6 bytes left
    EXPECT_EQ(f.told(f.flush()), "0: write(15)=15 flush()=0");
    f.host.shorten_nth(HostFn::Write, 3, 10);
    EXPECT_EQ(f.write(Part(0, 40), 4), 2u); // whole elements
    f.write(Part(0, 3));
    f.host.fail_from(HostFn::Write, 1);
    EXPECT_EQ(f.flush(), 0); // not reported; the host's flush is
    EXPECT_EQ(f.file->count, 0u);
    f.host.fail_from(HostFn::Flush, 1);
    EXPECT_EQ(f.flush(), -1);
}

TEST(BitReader, IsEmptiedByByteLevelAccess)
{
    const Cached f;
    const std::function<void()> accesses[] = {[&] { f.skip(1); },     [&] { f.read(2); },   [&] { f.seek(20); },
                                              [&] { f.seek(20, 7); }, [&] { f.write({}); }, [&] { f.flush(); }};
    for (const auto& access : accesses) {
        f.seek(0);
        __FLV_DMX__bitInit(f.file);
        __FLV_DMX__bitSkipBits(f.file, 20);
        f.peek(20);
        EXPECT_EQ(f.file->bits_left, 44);
        access();
        EXPECT_EQ(std::pair(f.file->bits_left, f.file->bits), std::pair(0, uint64_t{0}));
    }
    f.write({});
    f.file->bits_left = 9;
    f.write({}); // while writing, too; and there bits are not consumed
    EXPECT_EQ(f.file->bits_left, 0);
    __FLV_DMX__bitSkipBits(f.file, 9);
    EXPECT_EQ(f.file->bit_skip_pending, 0);
    f.seek(30);
    EXPECT_EQ(__FLV_DMX__bitGetUBits(f.file, 32), 0u); // the bytes are consumed, it stays empty
    EXPECT_EQ(std::pair(f.tell(), f.file->bits_left), std::pair(int64_t{34}, 0));
    __FLV_DMX__bitSkipBitsLong(f.file, 44); // starts it again
    EXPECT_EQ(std::pair(f.tell(), f.file->bits_left), std::pair(int64_t{40}, 60));
    f.file->bit_skip_pending = 1; // announces the reader's own skip
    f.skip(1);
    EXPECT_EQ(std::pair(f.file->bit_skip_pending, f.file->bits_left), std::pair(0, 60));
}

TEST(BitReader, TakesFieldsOfUpTo32Bits)
{
    const Cached f(UPDATE, Part(0x80, 200));
    __FLV_DMX__bitInit(f.file);
    EXPECT_EQ(__FLV_DMX__bitShowSBits(f.file, 4), 8u); // no sign
    EXPECT_EQ(__FLV_DMX__bitGetSBits(f.file, 4), 8u);
    EXPECT_EQ(__FLV_DMX__bitShowBit(f.file), 0u);
    EXPECT_EQ(__FLV_DMX__bitGetBit(f.file), 0u);
    __FLV_DMX__bitSkipBits(f.file, 3);
    for (const uint32_t n : {32u, 33u, 40u})
        EXPECT_EQ(__FLV_DMX__bitShowUBits(f.file, n), 0x81828384u);
    for (uint32_t n = 1; n <= 32; ++n) {
        __FLV_DMX__bitSkipBits(f.file, n);
        EXPECT_GT(f.file->bits_left, 32);
    }
}

} // namespace
