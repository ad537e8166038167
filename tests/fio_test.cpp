// The cached file and its bit reader by themselves: what they deliver, and which host calls that costs.

#include "support/expected.h"
#include "support/report.h"

#include <sstream>

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

constexpr ReaderOptions UPDATE = {CACHE, 0, 0, UPDATE_BINARY};

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
    int32_t close() { return __FLV_DMX__fioClose(std::exchange(file, nullptr)); }

    // Where the bytes came from, or the number returned, and the host calls since the last time.
    std::string told(const Bytes& got)
    {
        const size_t from = got.empty() ? 0 : got.front();
        EXPECT_EQ(got, Part(from, from + got.size()));
        return std::to_string(from) + ".." + told(static_cast<int64_t>(from + got.size()));
    }
    std::string told(int64_t result)
    {
        const std::string calls = host.take_log();
        return std::to_string(result) + (calls.empty() ? "" : ": " + calls);
    }
    // From here on the host has no 64-bit functions.
    void narrow()
    {
        host.use_32_bit_only();
        const fio_funcs_t funcs = host.funcs();
        __FLV_DMX__fioSetFunc(&funcs);
    }

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

// What a call that tests/data/cached_file.txt names returns, with the host calls that it costs.
std::string Call(Cached& f, const std::string& text)
{
    std::string name;
    int64_t first = 0, second = 1; // numbers
    uint32_t third = 1;
    std::istringstream(text) >> name >> first >> second >> third;
    const auto n = static_cast<uint32_t>(first), size = static_cast<uint32_t>(second);
    const auto whence = static_cast<int32_t>(second);
    const auto part = [&] { return Part(static_cast<size_t>(first), static_cast<size_t>(second)); };
    const auto fail = [&f](HostFn fn) { f.host.fail_from(fn, f.host.calls(fn) + 1); };
    const std::map<std::string, std::function<void()>> changes = {
        {"narrow", [&] { f.narrow(); }},
        {"short-write", [&] { f.host.shorten_nth(HostFn::Write, f.host.calls(HostFn::Write) + 1, n); }},
        {"no-seek", [&] { fail(HostFn::Seek); }},
        {"no-tell", [&] { fail(HostFn::Tell); }},
        {"no-write", [&] { fail(HostFn::Write); }},
        {"no-flush", [&] { fail(HostFn::Flush); }},
    };
    const std::map<std::string, std::function<std::string()>> calls = {
        {"peek", [&] { return f.told(f.peek(n)); }},
        {"read", [&] { return f.told(f.read(n, size)); }},
        {"write", [&] { return f.told(f.write(part(), third)); }},
        {"skip", [&] { return f.told(f.skip(n)); }},
        {"seek", [&] { return f.told(f.seek(first, whence)); }},
        {"seek32", [&] { return f.told(__FLV_DMX__fioSeek(f.file, static_cast<int32_t>(first), whence)); }},
        {"tell", [&] { return f.told(f.tell()); }},
        {"tell32", [&] { return f.told(__FLV_DMX__fioTell(f.file)); }},
        {"eof", [&] { return f.told(__FLV_DMX__fioIsEof(f.file)); }},
        {"flush", [&] { return f.told(f.flush()); }},
        {"close", [&] { return f.told(f.close()); }},
        {"size", [&] { return f.told(__FLV_DMX__fioSetCacheReadSize(f.file, n)); }},
        {"held", [&] { return f.told(f.file->count); }},
        {"copies", [&] { return f.told(static_cast<int64_t>(f.host.calls(HostFn::Copy))); }},
        {"contents", [&] { return f.told(f.host.contents()); }},
    };
    if (changes.count(name) == 0)
        return calls.at(name)();
    changes.at(name)();
    return "";
}

TEST(CachedFile, DoesWhatTheTableSays)
{
    std::optional<Cached> f;
    for (const std::vector<std::string>& row : ReadTable("cached_file.txt")) {
        uint32_t cache = 0, extra = 0;
        std::string opening;
        std::istringstream(row[0]) >> opening >> cache >> extra;
        if (opening == "file")
            f.emplace(extra != 0 ? ReaderOptions{cache, 1, extra} : ReaderOptions{cache, 0, 0, UPDATE_BINARY});
        else if (opening == "new")
            f.emplace(ReaderOptions{cache, 0, 0, UPDATE_BINARY | FIO_MODE_TRUNCATE});
        else
            EXPECT_EQ(Call(*f, row[0]), row.size() > 1 ? row[1] : "") << row[0];
    }
}

TEST(FioRead, CountsWholeElementsAndRejectsCountsThatAreTooLarge)
{
    Cached f(UPDATE, Part(0, 10));
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
