/* The hosts of the bench; their calls can be counted, recorded and replayed. */
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

/** C streams, and POSIX descriptors with a window. */
extern const std::array<HostKind, 2> g_hosts;

flvd_init_t MakeHost(const HostKind& kind, uint32_t options = 0);

enum class HostFn : uint8_t { Alloc, Free, Copy, Set, Read, Seek, Tell, Eof, Count };

/** Calls to a host. */
struct HostCost {
    std::array<uint64_t, static_cast<size_t>(HostFn::Count)> calls{};
    uint64_t bytes = 0; /**< bytes read */
    uint64_t held = 0;  /**< most memory held at once, in bytes */

    uint64_t of(HostFn fn) const { return calls[static_cast<size_t>(fn)]; }
    /** File calls: reads, seeks, tells and end-of-file queries. */
    uint64_t file_calls() const { return of(HostFn::Read) + of(HostFn::Seek) + of(HostFn::Tell) + of(HostFn::Eof); }
};

/** One recorded call; small, because replaying uses millions of them. Memory is given as a block and an offset. */
struct HostCall {
    HostFn fn;
    uint8_t whence;          /**< of a seek; the value of a set */
    uint8_t to, from;        /**< blocks */
    uint32_t size;           /**< bytes of an alloc, copy, set or read */
    uint32_t to_at, from_at; /**< offsets in the blocks; of a seek, its 64-bit offset, high part first */
};

struct Trace {
    std::vector<HostCall> open, play;
};

/**
 * Sits between the library and a host. The library's functions take no context argument, so only the newest of these
 * objects is in use.
 */
class HostWatch {
public:
    explicit HostWatch(const flvd_init_t& host);
    ~HostWatch();
    HostWatch(const HostWatch&) = delete;
    HostWatch& operator=(const HostWatch&) = delete;

    /** The initialisation block for the library. */
    const flvd_init_t& init() const { return m_outer; }
    /** Returns the counts since the last call and resets them, except for the memory held. */
    HostCost take_cost();
    /** Records calls there from now on; null stops recording. */
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
    std::vector<Block> m_blocks; /**< by number; freed blocks keep their number, with size 0 */
    uint64_t m_held = 0;
};

/** Opens and plays `path` on a host and records all calls to the host. */
Trace RecordPlaying(const flvd_init_t& host, const std::string& path);

/** Replays recorded calls on the same host, without a demultiplexer. Delivers no frames and cannot seek. */
PlayerPtr MakeReplayPlayer(const flvd_init_t& host);

} // namespace flvd_bench
