#include "judge.h"

#include <cstdio>
#include <cstdlib>

namespace flvd_fuzz {

// The library's frame buffer is the same block in all sessions: to allocate it costs more than the rest of a session.
static constexpr uint32_t FRAME_BUFFER_SIZE = 512000;
static const auto g_frame_buffer = std::make_unique<uint8_t[]>(FRAME_BUFFER_SIZE);

void require(bool holds, const char* what)
{
    if (holds)
        return;
    std::fprintf(stderr, "judgement: %s\n", what);
    std::abort();
}

Input::Input(const uint8_t* data, size_t size)
{
    if (size == 0)
        return;
    const uint8_t* const end = data + size - 1;
    const uint8_t* const control = end - std::min<std::ptrdiff_t>(*end, end - data);
    m_payload.assign(data, control);
    m_control.assign(control, end);
}

struct Host::Functions {
    static Host& host() { return static_cast<Host&>(current()); }
    static const fio_funcs_t& honest() { return host().m_honest; }
    static bool lies(Lie lie) { return (host().m_lies >> static_cast<uint32_t>(lie) & 1u) != 0; }

    static void* Alloc(uint32_t size)
    {
        void* const memory = honest().mem_alloc(size == FRAME_BUFFER_SIZE ? 1 : size);
        if (size != FRAME_BUFFER_SIZE || memory == nullptr || std::exchange(host().m_frame_buffer_held, true))
            return memory;
        honest().mem_free(memory);
        return g_frame_buffer.get();
    }
    static void Free(void* memory)
    {
        if (memory != g_frame_buffer.get())
            return honest().mem_free(memory);
        require(std::exchange(host().m_frame_buffer_held, false), "a frame buffer that is released twice");
    }
    static uint32_t Read(void* buffer, uint32_t size, uint32_t count, void* handle)
    {
        if (host().refuses(1))
            return 0;
        const uint32_t got = honest().file_read(buffer, size, count, handle);
        host().refuses(got / 1024);
        if (lies(Lie::ReadStands))
            honest().file_seek64(handle, -int64_t{got}, FIO_SEEK_CUR);
        return lies(Lie::ReadClaimsMore) ? count + 1 : got;
    }
    static int32_t Seek64(void* handle, int64_t offset, int32_t whence)
    {
        if (host().refuses(1) || lies(Lie::SeekStands))
            return lies(Lie::SeekStands) ? 0 : -1;
        return honest().file_seek64(handle, offset, lies(Lie::SeekForgetsWhere) ? FIO_SEEK_SET : whence);
    }
    static int64_t Tell64(void* handle)
    {
        const int64_t position = host().refuses(1) ? -1 : honest().file_tell64(handle);
        const auto call = static_cast<int64_t>(host().calls(HostFn::Tell));
        if (lies(Lie::TellGoesBack) && position > call % 16)
            return position - call % 2 * (call % 16);
        if (position >= 0 && lies(Lie::TellHuge))
            return INT64_MAX - call;
        return position >= 0 && lies(Lie::TellStands) ? 20 : position;
    }
    static int32_t Seek(void* handle, int32_t offset, int32_t whence) { return Seek64(handle, offset, whence); }
    static int32_t Tell(void* handle) { return static_cast<int32_t>(Tell64(handle)); }
    static int32_t Eof(void* handle)
    {
        const int32_t at_end = honest().file_eof(handle);
        return lies(Lie::AlwaysAtEnd) ? 1 : lies(Lie::NeverAtEnd) ? 0 : at_end;
    }
};

Host::Host(Bytes file) : FakeHost(std::move(file)), m_honest(FakeHost::funcs())
{
    on_call = [this](HostFn) { require(m_calls_left-- != 0, "more host calls than an operation may cost"); };
}

template <class Table> void Host::install(Table* table)
{
    table->mem_alloc = Functions::Alloc;
    table->mem_free = Functions::Free;
    table->file_read = Functions::Read;
    table->file_seek = Functions::Seek;
    table->file_tell = Functions::Tell;
    table->file_eof = Functions::Eof;
    table->file_seek64 = table->file_seek64 != nullptr ? Functions::Seek64 : nullptr;
    table->file_tell64 = table->file_tell64 != nullptr ? Functions::Tell64 : nullptr;
}

flvd_init_t Host::init(uint32_t options, uint32_t cache_size, uint32_t scan_read_size) const
{
    flvd_init_t init = FakeHost::init(options, cache_size, scan_read_size);
    install(&init);
    return init;
}

fio_file_t* Host::open_reader(uint32_t cache_size, uint32_t overread_extra) const
{
    fio_funcs_t table = FakeHost::funcs();
    install(&table);
    __FLV_DMX__fioSetFunc(&table);
    return __FLV_DMX__fioOpen(DEFAULT_FILE, FIO_MODE_READ, cache_size, overread_extra != 0 ? 1 : 0, overread_extra);
}

void Host::lie(uint32_t lies, uint64_t patience)
{
    m_lies = lies;
    m_patience = patience;
}

// Honest work is no effort.
bool Host::refuses(uint64_t effort)
{
    const bool refused = m_patience == 0;
    if (m_lies != 0)
        m_patience -= std::min(effort, m_patience);
    return refused;
}

int64_t Host::position(const fio_file_t* reader) const
{
    const int64_t host = m_honest.file_tell64(reader->handle);
    return reader->state == FIO_STATE_READ ? host - reader->count : host + reader->count;
}

void Host::require_clean() const
{
    require(live_blocks() == 0 && !m_frame_buffer_held, "memory that was not released");
    require(open_handles() == 0, "a file that was not closed");
}

uint32_t read_be(const Bytes& bytes, size_t position, size_t count)
{
    uint32_t value = 0;
    for (size_t i = position; i < position + count; ++i)
        value = value << 8 | bytes[i];
    return value;
}

bool read_tag(const Bytes& file, int64_t position, FileTag* tag)
{
    if (position < 0 || position + 13 > static_cast<int64_t>(file.size()))
        return false;
    const auto at = static_cast<size_t>(position);
    const uint32_t timestamp = read_be(file, at + 4, 3) | uint32_t{file[at + 7]} << 24;
    *tag = {file[at], read_be(file, at + 1, 3), timestamp, read_be(file, at + 8, 3), file[at + 11], file[at + 12]};
    return true;
}

} // namespace flvd_fuzz
