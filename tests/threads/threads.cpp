// Plays ten callback files on ten threads at the same time: threads FILE. It is compiled with the thread sanitizer,
// which aborts if two threads access the same memory without a lock.

#include "flvdmx/flvdmx.hpp"
#include "support/callback_file.h"

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

// Counts the frames from the start and, after a seek, from the middle; 0 if anything failed.
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

// Opens under the lock that File::open takes, and plays when all files are open.
void PlayOwnFile(const std::vector<char>& bytes, std::atomic<size_t>& opened, size_t& frames)
{
    const flvd_test::CallbackFile source(bytes.data(), bytes.size());
    auto file = flvdmx::File::open(source.name, flvdmx::make_host(flvd_callback_host_fill));
    ++opened;
    while (opened < THREADS) // an open must not run during another call
        std::this_thread::yield();
    frames = file ? Play(*file) : 0;
}

} // namespace

int main(int argc, char** argv)
{
    if (argc != 2)
        return 2;
    std::ifstream in(argv[1], std::ios::binary);
    const std::vector<char> bytes{std::istreambuf_iterator<char>(in), {}};
    size_t wanted = 0;
    for (int round = 0; round < ROUNDS; ++round) {
        std::atomic<size_t> opened = 0;
        std::array<size_t, THREADS> frames{};
        std::vector<std::thread> threads;
        threads.reserve(THREADS);
        for (size_t& count : frames)
            threads.emplace_back(PlayOwnFile, std::cref(bytes), std::ref(opened), std::ref(count));
        for (std::thread& thread : threads)
            thread.join();
        wanted = round == 0 ? frames[0] : wanted;
        if (wanted == 0 || std::count(frames.begin(), frames.end(), wanted) != static_cast<std::ptrdiff_t>(THREADS))
            return std::puts("frames were lost"), 1;
    }
    std::printf("%zu frames on each of %zu threads\n", wanted, THREADS);
    return 0;
}
