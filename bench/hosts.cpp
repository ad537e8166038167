#include "hosts.h"

#include "flvdmx_player.h"

#include "flvdmx/posix_host.h"
#include "flvdmx/stdio_host.h"

#include <algorithm>

namespace flvd_bench {

const std::array<HostKind, 2> g_hosts = {{
    {"stdio", flvd_stdio_host_fill},
    {"posix", flvd_posix_host_fill},
}};

flvd_init_t MakeHost(const HostKind& kind, uint32_t options)
{
    flvd_init_t init;
    kind.fill(&init);
    init.options = options;
    return init;
}

namespace {

constexpr uint8_t NO_BLOCK = 255; // memory that the host did not allocate: the caller's or the library's

HostWatch* g_watch = nullptr;

} // namespace

struct WatchFunctions {
    static const flvd_init_t& host() { return g_watch->m_host; }

    static void* alloc(uint32_t size)
    {
        void* const block = host().mem_alloc(size);
        g_watch->note(HostFn::Alloc, 0, nullptr, nullptr, size);
        g_watch->hold(block, size);
        return block;
    }
    static void release(void* block)
    {
        g_watch->note(HostFn::Free, 0, block, nullptr, 0);
        g_watch->release(block);
        host().mem_free(block);
    }
    static void* copy(void* to, const void* from, uint32_t size)
    {
        g_watch->note(HostFn::Copy, 0, to, from, size);
        return host().mem_copy(to, from, size);
    }
    static void* set(void* to, int value, uint32_t size)
    {
        g_watch->note(HostFn::Set, static_cast<uint8_t>(value), to, nullptr, size);
        return host().mem_set(to, value, size);
    }
    static uint32_t read(void* to, uint32_t size, uint32_t count, void* handle)
    {
        const uint32_t got = host().file_read(to, size, count, handle);
        g_watch->note(HostFn::Read, 0, to, nullptr, count);
        g_watch->m_cost.bytes += got;
        return got;
    }
    static int32_t seek(void* handle, int64_t offset, int32_t whence)
    {
        g_watch->note_seek(offset, whence);
        return host().file_seek64(handle, offset, whence);
    }
    static int64_t tell(void* handle)
    {
        g_watch->note(HostFn::Tell, 0, nullptr, nullptr, 0);
        return host().file_tell64(handle);
    }
    static int32_t eof(void* handle)
    {
        g_watch->note(HostFn::Eof, 0, nullptr, nullptr, 0);
        return host().file_eof(handle);
    }
};

HostWatch::HostWatch(const flvd_init_t& host) : m_host(host), m_outer(host)
{
    m_outer.mem_alloc = WatchFunctions::alloc;
    m_outer.mem_free = WatchFunctions::release;
    m_outer.mem_copy = WatchFunctions::copy;
    m_outer.mem_set = WatchFunctions::set;
    m_outer.file_read = WatchFunctions::read;
    m_outer.file_eof = WatchFunctions::eof;
    m_outer.file_seek64 = WatchFunctions::seek;
    m_outer.file_tell64 = WatchFunctions::tell;
    g_watch = this;
}

HostWatch::~HostWatch()
{
    g_watch = nullptr;
}

HostCost HostWatch::take_cost()
{
    HostCost cost = m_cost;
    m_cost = {};
    m_cost.held = m_held;
    return cost;
}

void HostWatch::note(HostFn fn, uint8_t whence, const void* to, const void* from, uint32_t size)
{
    ++m_cost.calls[static_cast<size_t>(fn)];
    if (m_calls == nullptr)
        return;
    const auto [to_block, to_at] = locate(to);
    const auto [from_block, from_at] = locate(from);
    m_calls->push_back({fn, whence, to_block, from_block, size, to_at, from_at});
}

void HostWatch::note_seek(int64_t offset, int32_t whence)
{
    ++m_cost.calls[static_cast<size_t>(HostFn::Seek)];
    if (m_calls == nullptr)
        return;
    const auto bits = static_cast<uint64_t>(offset);
    m_calls->push_back({HostFn::Seek, static_cast<uint8_t>(whence), NO_BLOCK, NO_BLOCK, 0,
                        static_cast<uint32_t>(bits >> 32), static_cast<uint32_t>(bits)});
}

std::pair<uint8_t, uint32_t> HostWatch::locate(const void* place) const
{
    const auto* const byte = static_cast<const uint8_t*>(place);
    for (size_t i = 0; i < m_blocks.size() && i < NO_BLOCK; ++i)
        if (byte >= m_blocks[i].begin && byte < m_blocks[i].begin + m_blocks[i].size)
            return {static_cast<uint8_t>(i), static_cast<uint32_t>(byte - m_blocks[i].begin)};
    return {NO_BLOCK, 0};
}

void HostWatch::hold(void* block, uint32_t size)
{
    m_blocks.push_back({static_cast<uint8_t*>(block), size});
    m_held += size;
    m_cost.held = std::max(m_cost.held, m_held);
}

void HostWatch::release(const void* block)
{
    for (Block& held : m_blocks)
        if (held.begin == block && held.size != 0) {
            m_held -= held.size;
            held.size = 0;
        }
}

Trace RecordPlaying(const flvd_init_t& host, const std::string& path)
{
    Trace trace;
    HostWatch watch(host);
    FlvdmxPlayer player(watch.init());
    watch.record(&trace.open);
    if (!player.open(path))
        return {};
    watch.record(&trace.play);
    player.play();
    watch.record(nullptr);
    player.close();
    return trace;
}

namespace {

class ReplayPlayer : public Player {
public:
    explicit ReplayPlayer(const flvd_init_t& host) : m_host(host) {}
    ~ReplayPlayer() override { close(); }
    ReplayPlayer(const ReplayPlayer&) = delete;
    ReplayPlayer& operator=(const ReplayPlayer&) = delete;

    bool open(const std::string& path) override
    {
        close();
        if (path != m_path)
            m_trace = RecordPlaying(m_host, path);
        m_path = path;
        m_handle = m_host.file_open(path.c_str(), "rb");
        if (m_handle == nullptr || m_trace.open.empty())
            return false;
        replay(m_trace.open);
        return true;
    }

    void close() override
    {
        for (uint8_t* block : m_blocks)
            m_host.mem_free(block);
        m_blocks.clear();
        if (m_handle != nullptr)
            m_host.file_close(m_handle);
        m_handle = nullptr;
    }

    Tally play() override
    {
        replay(m_trace.play);
        return {};
    }
    uint32_t seek(int32_t) override { return 0; }

private:
    void replay(const std::vector<HostCall>& calls)
    {
        for (const HostCall& call : calls)
            replay(call);
    }

    void replay(const HostCall& call)
    {
        switch (call.fn) {
        case HostFn::Alloc:
            m_blocks.push_back(static_cast<uint8_t*>(m_host.mem_alloc(call.size)));
            break;
        case HostFn::Free:
            release(call.to);
            break;
        case HostFn::Copy:
            m_host.mem_copy(place(call.to, call.to_at), place(call.from, call.from_at), call.size);
            break;
        case HostFn::Set:
            m_host.mem_set(place(call.to, call.to_at), call.whence, call.size);
            break;
        case HostFn::Read:
            m_host.file_read(place(call.to, call.to_at), 1, call.size, m_handle);
            break;
        case HostFn::Seek:
            m_host.file_seek64(m_handle, offset(call), call.whence);
            break;
        case HostFn::Tell:
            m_host.file_tell64(m_handle);
            break;
        case HostFn::Eof:
            m_host.file_eof(m_handle);
            break;
        case HostFn::Count:
            break;
        }
    }

    static int64_t offset(const HostCall& call)
    {
        return static_cast<int64_t>(uint64_t{call.to_at} << 32 | call.from_at);
    }

    uint8_t* place(uint8_t block, uint32_t at)
    {
        return block < m_blocks.size() ? m_blocks[block] + at : m_else.data();
    }

    void release(uint8_t block)
    {
        if (block >= m_blocks.size())
            return;
        m_host.mem_free(m_blocks[block]);
        m_blocks[block] = nullptr;
    }

    flvd_init_t m_host;
    std::string m_path;
    Trace m_trace;
    void* m_handle = nullptr;
    std::vector<uint8_t*> m_blocks;
    std::vector<uint8_t> m_else = std::vector<uint8_t>(1u << 24); // stands in for memory that the host did not allocate
};

} // namespace

PlayerPtr MakeReplayPlayer(const flvd_init_t& host)
{
    return std::make_unique<ReplayPlayer>(host);
}

} // namespace flvd_bench
