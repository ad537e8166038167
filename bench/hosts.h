/* The hosts of the bench, and what passes between them and the library: counted, written down, done again. */
#pragma once

#include "player.h"

#include "flvdmx/flvdmx.h"

#include <array>
#include <vector>

namespace flvd_bench {

struct HostKind {
    const char* name;
    void (*fill)(flvd_init_t*);
};

/** C streams, POSIX descriptors with a window. */
extern const std::array<HostKind, 2> g_hosts;

flvd_init_t MakeHost(const HostKind& kind, uint32_t options = 0);

enum class HostFn : uint8_t { Alloc, Free, Copy, Set, Read, Seek, Tell, Eof, Count };

/** What was asked of a host. */
struct HostCost {
    std::array<uint64_t, static_cast<size_t>(HostFn::Count)> calls{};
    uint64_t bytes = 0; /**< read */
    uint64_t held = 0;  /**< of memory, at most */

    uint64_t of(HostFn fn) const { return calls[static_cast<size_t>(fn)]; }
    /** Of the file: reads, seeks, position and end queries. */
    uint64_t file_calls() const { return of(HostFn::Read) + of(HostFn::Seek) + of(HostFn::Tell) + of(HostFn::Eof); }
};

/** One call, small: playing replays millions of them. Memory is named by its block and a place in it. */
struct HostCall {
    HostFn fn;
    uint8_t whence;          /**< of a seek; of a set its value */
    uint8_t to, from;        /**< blocks */
    uint32_t size;           /**< of alloc, copy, set and read */
    uint32_t to_at, from_at; /**< places in the blocks; of a seek together its 64-bit offset, high part first */
};

struct Trace {
    std::vector<HostCall> open, play;
};

/**
 * Stands between the library and a host. The library's tables carry no context, so one of these is in use at a time:
 * the newest.
 */
class HostWatch {
public:
    explicit HostWatch(const flvd_init_t& host);
    ~HostWatch();
    HostWatch(const HostWatch&) = delete;
    HostWatch& operator=(const HostWatch&) = delete;

    /** What the library is given. */
    const flvd_init_t& init() const { return m_outer; }
    /** Since the last time; begins anew but for the memory held. */
    HostCost take_cost();
    /** Calls from now on go there too, or nowhere. */
    void record(std::vector<HostCall>* calls) { m_calls = calls; }

private:
    friend struct WatchFunctions;
    struct Block {
        uint8_t* begin;
        uint32_t size;
    };

    void note(HostFn fn, uint8_t whence, const void* to, const void* from, uint32_t size);
    void note_seek(int64_t offset, int32_t whence);
    std::pair<uint8_t, uint32_t> locate(const void* place) const;
    void hold(void* block, uint32_t size);
    void release(const void* block);

    flvd_init_t m_host, m_outer;
    HostCost m_cost;
    std::vector<HostCall>* m_calls = nullptr;
    std::vector<Block> m_blocks; /**< by number; given back ones keep theirs, with size 0 */
    uint64_t m_held = 0;
};

/** Opens and plays `path` on a host, and writes down all that the host was asked. */
Trace RecordPlaying(const flvd_init_t& host, const std::string& path);

/** The same calls on the same host, without a demuxer. Delivers nothing; does not seek. */
PlayerPtr MakeReplayPlayer(const flvd_init_t& host);

} // namespace flvd_bench
