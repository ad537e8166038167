// The cached file and its bit reader on their own: what they deliver, and which host calls that costs.

#include "support/expected.h"
#include "support/report.h"

#include <iomanip>
#include <sstream>

using namespace flvd_test;

namespace {

constexpr uint32_t CACHE = 64;
constexpr uint32_t UPDATE_BINARY = FIO_MODE_READ | FIO_MODE_WRITE | FIO_MODE_BINARY;

// Byte n of most files is n, so a value shows where it came from.
Bytes Part(size_t from, size_t to)
{
    Bytes bytes;
    while (from < to)
        bytes.push_back(static_cast<uint8_t>(from++));
    return bytes;
}

// A host with an open file, and the calls that tests/data/cached_file.txt names; the log starts after the open.
class Cached {
public:
    explicit Cached(const ReaderOptions& options, Bytes contents = Part(0, 200))
        : host(std::move(contents)), file(host.open_reader(options))
    {
        host.start_log();
    }
    ~Cached() { __FLV_DMX__fioClose(file); }

    // Makes a call. Returns its result and the host calls that it costs.
    std::string call(const std::string& text)
    {
        std::string name;
        int64_t first = 0, second = 1; // numbers
        uint32_t third = 1;
        std::istringstream(text) >> name >> std::setbase(0) >> first >> second >> third;
        const auto n = static_cast<uint32_t>(first), size = static_cast<uint32_t>(second);
        const auto signed_n = static_cast<int32_t>(first), whence = static_cast<int32_t>(second);
        const ReaderOptions other = {.cache_size = CACHE, .mode = n};
        const auto fail = [this](HostFn fn) { host.fail_from(fn, host.calls(fn) + 1); };
        const std::map<std::string, std::function<void()>> changes = {
            {"narrow",
             [&] {
                 host.use_32_bit_only(); // for all later calls
                 const fio_funcs_t funcs = host.funcs();
                 __FLV_DMX__fioSetFunc(&funcs);
             }},
            {"short-write", [&] { host.shorten_nth(HostFn::Write, host.calls(HostFn::Write) + 1, n); }},
            {"start-bits", [&] { __FLV_DMX__bitInit(file); }},
            {"skip-bits", [&] { __FLV_DMX__bitSkipBits(file, n); }},
            {"skip-long", [&] { __FLV_DMX__bitSkipBitsLong(file, n); }},
            {"set-left", [&] { file->bits_left = signed_n; }},
            {"set-pending", [&] { file->bit_skip_pending = signed_n; }},
            {"no-seek", [&] { fail(HostFn::Seek); }},
            {"no-tell", [&] { fail(HostFn::Tell); }},
            {"no-write", [&] { fail(HostFn::Write); }},
            {"no-flush", [&] { fail(HostFn::Flush); }},
        };
        const std::map<std::string, std::function<std::string()>> calls = {
            {"peek", [&] { return told(peek(n)); }},
            {"read", [&] { return told(read(n, size)); }},
            {"write", [&] { return told(write(first, second, third)); }},
            {"copy", [&] { return told(__FLV_DMX__fioShowBytesByCopy(Bytes(n).data(), n, file)); }},
            {"skip", [&] { return told(__FLV_DMX__fioSkipBytes(n, file)); }},
            {"seek", [&] { return told(__FLV_DMX__fioSeek64(file, first, whence)); }},
            {"seek32", [&] { return told(__FLV_DMX__fioSeek(file, signed_n, whence)); }},
            {"tell", [&] { return told(__FLV_DMX__fioTell64(file)); }},
            {"tell32", [&] { return told(__FLV_DMX__fioTell(file)); }},
            {"eof", [&] { return told(__FLV_DMX__fioIsEof(file)); }},
            {"flush", [&] { return told(__FLV_DMX__fioFlush(file)); }},
            {"close", [&] { return told(__FLV_DMX__fioClose(std::exchange(file, nullptr))); }},
            {"mode", [&] { return told(__FLV_DMX__fioClose(host.open_reader(other))); }},
            {"size", [&] { return told(__FLV_DMX__fioSetCacheReadSize(file, n)); }},
            {"block", [&] { return told(static_cast<int64_t>(host.size_of(file->cache))); }},
            {"extra", [&] { return told(file->overread_extra); }},
            {"held", [&] { return told(file->count); }},
            {"copies", [&] { return told(static_cast<int64_t>(host.calls(HostFn::Copy))); }},
            {"contents", [&] { return told(host.contents()); }},
            {"bits", [&] { return told(__FLV_DMX__bitShowUBits(file, n)); }},
            {"bit", [&] { return told(__FLV_DMX__bitShowBit(file)); }},
            {"signed", [&] { return told(__FLV_DMX__bitShowSBits(file, n)); }},
            {"take-bits", [&] { return told(__FLV_DMX__bitGetUBits(file, n)); }},
            {"take-bit", [&] { return told(__FLV_DMX__bitGetBit(file)); }},
            {"take-signed", [&] { return told(__FLV_DMX__bitGetSBits(file, n)); }},
            {"left", [&] { return told(file->bits_left); }},
            {"held-bits", [&] { return std::to_string(file->bits); }},
            {"pending", [&] { return told(file->bit_skip_pending); }},
        };
        if (!changes.contains(name))
            return calls.at(name)();
        changes.at(name)();
        return "";
    }

    FakeHost host;
    fio_file_t* file;

private:
    // Returns the bytes of a peek.
    Bytes peek(uint32_t n) const
    {
        const uint8_t* bytes = nullptr;
        const uint32_t got = __FLV_DMX__fioShowBytesByPtr(&bytes, n, file);
        EXPECT_EQ(bytes == nullptr, file->state == FIO_STATE_WRITE); // unchanged if rejected
        return Bytes(bytes, bytes + got);
    }
    // Returns the complete elements read, as bytes.
    Bytes read(uint32_t count, uint32_t size) const
    {
        Bytes out(size_t{size} * count);
        out.resize(size_t{__FLV_DMX__fioRead(out.data(), size, count, file)} * size);
        return out;
    }
    uint32_t write(int64_t from, int64_t to, uint32_t size) const
    {
        const Bytes bytes = Part(static_cast<size_t>(from), static_cast<size_t>(to));
        return __FLV_DMX__fioWrite(bytes.data(), size, static_cast<uint32_t>(bytes.size()) / size, file);
    }
    // Describes where the bytes came from, or the number returned, and the host calls since the previous call.
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
};

TEST(CachedFile, MatchesTheTable)
{
    std::optional<Cached> f;
    for (const std::vector<std::string>& row : ReadTable("cached_file.txt")) {
        uint32_t cache = 0, extra = 0;
        std::string opening;
        std::istringstream(row[0]) >> opening >> cache >> extra;
        if (opening == "file")
            f.emplace(extra != 0 ? ReaderOptions{cache, 1, extra} : ReaderOptions{cache, 0, 32, UPDATE_BINARY});
        else if (opening == "new")
            f.emplace(ReaderOptions{cache, 0, 0, UPDATE_BINARY | FIO_MODE_TRUNCATE});
        else
            EXPECT_EQ(f->call(row[0]), row.size() > 1 ? row[1] : "") << row[0];
    }
}

TEST(CachedFile, RejectsCountsThatAreTooLarge)
{
    Cached f({CACHE, 0, 0, UPDATE_BINARY}, Part(0, 10));
    __FLV_DMX__fiodbgReset();
    EXPECT_EQ(__FLV_DMX__fiodbgReadBytes(), 0u); // this build does not count
    EXPECT_EQ(f.call("seek 2 0"), "0: seek64(2,0)=0");
    uint8_t byte = 77;
    const std::pair<uint32_t, uint32_t> refused[] = {{0, 5}, {0x10000, 0x10000}, {3, 0x55555556}}; // 2 with 32 bits
    for (const auto& [size, count] : refused) {
        EXPECT_EQ(__FLV_DMX__fioRead(&byte, size, count, f.file), 0u);
        EXPECT_EQ(__FLV_DMX__fioWrite(&byte, size, count, f.file), 0u);
    }
    EXPECT_EQ(byte, 77);
    EXPECT_EQ(f.call("peek 1"), "2..3: read(64)=8");
    EXPECT_EQ(__FLV_DMX__fioShowBytesByCopy(&byte, 1, f.file), 1u);
    EXPECT_EQ(byte, 2);

    fio_funcs_t boaster = f.host.funcs(); // claims more than was requested
    boaster.file_read = [](void*, uint32_t, uint32_t count, void*) { return count + 1000; };
    boaster.file_write = [](const void*, uint32_t, uint32_t count, void*) { return count + 7; };
    boaster.file_tell = [](void*) { return INT32_MIN; };
    __FLV_DMX__fioSetFunc(&boaster);
    EXPECT_LT(__FLV_DMX__fioTell(f.file), 0); // subtracting the read-ahead does not make it valid
    f.call("seek 0 0");
    for (const char* const call : {"peek 10", "read 150", "read 5"})
        EXPECT_EQ(f.call(call), "0..0");
    EXPECT_EQ(f.file->count, 0u);
    f.call("write 0 10");
    EXPECT_EQ(__FLV_DMX__fioWrite(&byte, 1, 0xFFFFFFF8, f.file), 0xFFFFFFF8); // does not fit, though the sum wraps
    EXPECT_EQ(f.host.open_reader({0xFFFFFFF0, 1, 0x20}), nullptr);            // the sum does not fit 32 bits
}

} // namespace
