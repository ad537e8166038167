// Ten callback files played on ten threads at the same time: threads FILE. The thread sanitizer, with which this is
// compiled, ends it when two of them touch the same memory.

#include "flvdmx/callback_host.h"
#include "flvdmx/flvdmx.hpp"

#include <algorithm>
#include <array>
#include <atomic>
#include <cstdio>
#include <fstream>
#include <functional>
#include <iterator>
#include <thread>
#include <vector>

namespace {

constexpr size_t THREADS = 10;
constexpr int ROUNDS = 5;

using Source = std::vector<char>;

uint32_t ReadAt(void* user, int64_t position, void* buffer, uint32_t size)
{
    const Source& bytes = *static_cast<Source*>(user);
    const auto end = static_cast<int64_t>(bytes.size());
    const auto count = std::clamp<int64_t>(end - position, 0, size);
    std::copy_n(bytes.begin() + std::min(position, end), count, static_cast<char*>(buffer));
    return static_cast<uint32_t>(count);
}

int64_t GetSize(void* user)
{
    return static_cast<int64_t>(static_cast<const Source*>(user)->size());
}

// Frames from the beginning and, after a seek, from the middle; 0 when anything failed.
size_t Play(flvdmx::File& file)
{
    size_t frames = 0;
    for (const flvdmx::Frame& frame : file.frames())
        frames += frame.position >= 0 ? 1 : 0;
    const bool listed = file.keyframes() && file.metadata() && file.seek(file.info().duration / 2);
    for (const flvdmx::Frame& frame : file.frames())
        frames += frame.position >= 0 ? 1 : 0;
    return listed ? frames : 0;
}

// Opens under the lock that opening takes by itself, and plays when all are open.
void PlayOwnFile(Source& bytes, std::atomic<size_t>& opened, size_t& frames)
{
    flvd_callback_file_t source = {ReadAt, GetSize, &bytes, "", nullptr};
    auto file = flvdmx::File::open(flvd_callback_host_add(&source), flvdmx::make_host(flvd_callback_host_fill));
    flvd_callback_host_remove(&source);
    ++opened;
    while (opened < THREADS) // an open must not run beside a frame
        std::this_thread::yield();
    frames = file ? Play(*file) : 0;
}

} // namespace

int main(int argc, char** argv)
{
    if (argc != 2)
        return 2;
    std::ifstream in(argv[1], std::ios::binary);
    Source bytes{std::istreambuf_iterator<char>(in), {}};
    size_t wanted = 0;
    for (int round = 0; round < ROUNDS; ++round) {
        std::atomic<size_t> opened = 0;
        std::array<size_t, THREADS> frames{};
        std::vector<std::thread> threads;
        threads.reserve(THREADS);
        for (size_t& count : frames)
            threads.emplace_back(PlayOwnFile, std::ref(bytes), std::ref(opened), std::ref(count));
        for (std::thread& thread : threads)
            thread.join();
        wanted = round == 0 ? frames[0] : wanted;
        if (wanted == 0 || std::count(frames.begin(), frames.end(), wanted) != static_cast<std::ptrdiff_t>(THREADS))
            return std::puts("frames were lost"), 1;
    }
    std::printf("%zu frames on each of %zu threads\n", wanted, THREADS);
    return 0;
}
