// All hosts of the kit keep the contract of the public header, on the same bytes.

#include "flvdmx/memory_host.h"
#include "flvdmx/posix_host.h"
#include "flvdmx/stdio_host.h"
#include "support/callback_file.h"
#include "support/flv_writer.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cerrno>
#include <filesystem>
#include <fstream>
#include <map>
#include <sys/stat.h>
#include <thread>

using namespace flvd_test;

namespace {

const std::map<std::string, void (*)(flvd_init_t*)> g_fill = {{"stdio", flvd_stdio_host_fill},
                                                              {"posix", flvd_posix_host_fill},
                                                              {"memory", flvd_memory_host_fill},
                                                              {"callbacks", flvd_callback_host_fill}};
constexpr int64_t SIZE = 200000, FAR = (int64_t{1} << 32) + 12345; // SIZE: a little more than three windows

class Host : public testing::TestWithParam<std::string> {
protected:
    Host()
    {
        g_fill.at(GetParam())(&t);
        append(file, bytes);
        flvd_memory_host_add(&memory);
        name = GetParam() == "callbacks" ? callbacks.name : file;
        handle = t.file_open(name.c_str(), "rb");
    }
    ~Host() override
    {
        EXPECT_EQ(t.file_close(handle), 0);
        flvd_memory_host_remove(&memory);
        std::filesystem::remove_all(folder);
    }
    static void append(const std::string& path, const std::string& s) { std::ofstream(path, std::ios::app) << s; }
    std::string read(size_t n) const
    {
        std::string out(n, '\0');
        return out.substr(0, t.file_read(out.data(), 1, static_cast<uint32_t>(n), handle));
    }

    flvd_init_t t{};
    const Bytes noise = Noise(SIZE);
    const std::string bytes = {noise.begin(), noise.end()};
    // mkdtemp replaces the six letters, so that tests that run at the same time do not share a folder.
    const std::string folder = mkdtemp((testing::TempDir() + "host.XXXXXX").data()), file = folder + "/file";
    flvd_memory_file_t memory = {file.c_str(), bytes.data(), SIZE, nullptr};
    CallbackFile callbacks{bytes.data(), SIZE};
    std::string name;
    void* handle = nullptr;
};
class FileHost : public Host {};

// Seeks and reads over every border of the window: offset, whence, bytes.
TEST_P(Host, ReadsSeeksAndTells)
{
    const std::tuple<int64_t, int, size_t> steps[] = {
        {0, 0, 9},       {0, 1, 70000},     {-70009, 1, 20}, {65530, 0, 12}, {65536, 0, 65536}, {0, 2, 0},
        {131072, 0, 5},  {-4, 2, 4},        {-32, 1, 9},     {-9, 1, 9},     {-5000, 2, 16},    {-40000, 1, 16},
        {9999, 0, 1},    {1000, 1, 32767},  {-1, 2, 2},      {9, 2, 5},      {0, 2, 1},         {10, 0, 150000},
        {199990, 0, 40}, {0, 0, 250000},    {199999, 0, 1},  {3, 0, 4},      {-7, 1, 3},        {65000, 1, 9999},
        {FAR, 0, 70000}, {75000, 0, 70000}, {-1, 1, 1},      {0, 0, 1}};
    int64_t at = 0;
    for (const auto& [offset, whence, n] : steps) {
        SCOPED_TRACE(std::to_string(offset) + " from " + std::to_string(whence));
        ASSERT_EQ(t.file_seek64(handle, offset, whence), 0);
        at = offset + (whence == 0 ? 0 : whence == 1 ? at : SIZE);
        ASSERT_EQ(t.file_tell64(handle), at);
        EXPECT_EQ(t.file_eof(handle), 0);
        const std::string there = bytes.substr(static_cast<size_t>(std::min(at, SIZE)), n);
        EXPECT_EQ(read(n), there);
        EXPECT_EQ(t.file_eof(handle) != 0, there.size() < n);
        at += std::distance(there.begin(), there.end());
        EXPECT_EQ(t.file_tell(handle), at > INT32_MAX ? -1 : at);
    }
    EXPECT_NE(t.file_seek64(handle, -1, 0), 0);
    for (const int unknown : {-1, 3})
        EXPECT_NE(t.file_seek64(handle, 1, unknown), 0);
    EXPECT_EQ(t.file_tell64(handle), at) << "a failed seek does not move the position";
    for (const std::string& path : {folder + "/absent", folder}) {
        EXPECT_EQ(t.file_open(path.c_str(), "rb"), nullptr) << path;
        const bool is_folder = path == folder && (GetParam() == "stdio" || GetParam() == "posix");
        EXPECT_EQ(errno, is_folder ? EISDIR : ENOENT) << path;
    }
}

// After the end flag was set, a seek makes added bytes visible.
TEST_P(Host, SeesAFileGrow)
{
    std::filesystem::resize_file(file, memory.size = callbacks.size = SIZE - 100);
    EXPECT_EQ(read(SIZE).size(), memory.size);
    append(file, bytes.substr(SIZE - 100, 100));
    memory.size = callbacks.size = SIZE;
    ASSERT_EQ(t.file_seek64(handle, -50, 1), 0);
    EXPECT_EQ(read(150), bytes.substr(SIZE - 150, 150));
}

// A file that had its full size from the start: the stdio host does not cache bytes.
TEST_P(FileHost, SeesBytesChangedInPlace)
{
    EXPECT_EQ(read(10), bytes.substr(0, 10));
    std::fstream(file, std::ios::in | std::ios::out) << "changed";
    ASSERT_EQ(t.file_seek64(handle, 0, 0), 0);
    EXPECT_EQ(read(7), GetParam() == "stdio" ? "changed" : bytes.substr(0, 7));
}

TEST_P(FileHost, ReachesBeyondFourGibibytes)
{
    std::filesystem::resize_file(file, FAR);
    append(file, "far");
    ASSERT_EQ(t.file_seek64(handle, -3, 2), 0);
    EXPECT_EQ(t.file_tell64(handle), FAR);
    EXPECT_EQ(read(4), "far");
    ASSERT_EQ(t.file_seek64(handle, 12345, 0), 0);
    EXPECT_EQ(read(3), bytes.substr(12345, 3)) << "the positions differ only in the high half";
}

// A pipe returns only what has been written so far; a read continues until the request is complete.
TEST_P(FileHost, FillsARequestFromAPipe)
{
    const std::string fifo = folder + "/fifo";
    ASSERT_EQ(mkfifo(fifo.c_str(), 0600), 0);
    std::thread writer([&] {
        const std::ofstream held(fifo);
        for (size_t i = 0; i < SIZE; i += 10000)
            append(fifo, bytes.substr(i, 10000));
    });
    t.file_close(handle);
    handle = t.file_open(fifo.c_str(), "rb");
    EXPECT_EQ(read(25000), bytes.substr(0, 25000));
    EXPECT_EQ(read(100000), bytes.substr(25000, 100000));
    EXPECT_EQ(read(75001), bytes.substr(125000, 75000)); // one byte more than there is
    writer.join();
}

// Appending moves the position to the end of what was written, wherever it was before.
TEST_P(FileHost, ReturnsThePositionAfterAnAppend)
{
    t.file_close(handle);
    handle = t.file_open(file.c_str(), GetParam() == "posix" ? "rb" : "a+b"); // the POSIX host only reads
    ASSERT_EQ(t.file_seek64(handle, 100, 0), 0);
    EXPECT_EQ(read(5), bytes.substr(100, 5));
    const uint32_t put = t.file_write("more", 1, 4, handle);
    EXPECT_EQ(put, GetParam() == "posix" ? 0 : 4);
    EXPECT_EQ(t.file_tell64(handle), put == 0 ? 105 : SIZE + 4);
}

TEST(KitCallbacks, MayFailOrBeMissing)
{
    flvd_init_t host;
    flvd_callback_host_fill(&host);
    const auto read_at = [](void*, int64_t, void*, uint32_t size) { return size + 1; }; // claims too much
    flvd_callback_file_t file = {read_at, [](void*) { return int64_t{-1}; }, nullptr, "", nullptr};
    void* const handle = host.file_open(flvd_callback_host_add(&file), "rb");
    flvd_callback_host_remove(&file);
    char byte = 0;
    EXPECT_EQ(host.file_read(&byte, 1, 1, handle), 0u);
    EXPECT_NE(host.file_eof(handle), 0);
    EXPECT_NE(host.file_seek64(handle, 0, FIO_SEEK_END), 0);
    EXPECT_EQ(host.file_close(handle), 0);
    EXPECT_EQ(host.file_open(file.name, "rb"), nullptr) << "removed";
    file.get_size = nullptr;
    EXPECT_EQ(flvd_callback_host_add(&file), nullptr);
}

INSTANTIATE_TEST_SUITE_P(Kit, FileHost, testing::Values("stdio", "posix"));
INSTANTIATE_TEST_SUITE_P(Kit, Host, testing::Values("stdio", "posix", "memory", "callbacks"));

} // namespace
