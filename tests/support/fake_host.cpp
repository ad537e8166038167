#include "fake_host.h"

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <tuple>

namespace flvd_test {

static constexpr uint32_t HUGE_BLOCK = 64u << 20;
static constexpr uint8_t FRESH_MEMORY = 0xA5;
static constexpr uint8_t RELEASED_MEMORY = 0xDD;

FakeHost::~FakeHost()
{
    if (live_blocks() + open_handles() != 0)
        violation(std::to_string(live_blocks()) + " blocks and " + std::to_string(open_handles()) + " files were kept");
    for (const auto& [block, size] : m_blocks)
        std::free(const_cast<uint8_t*>(block));
    m_current = m_previous;
}

void FakeHost::violation(const std::string& what)
{
    if (m_handler != nullptr)
        return m_handler(what);
    std::fprintf(stderr, "fake host: %s\n", what.c_str());
    std::abort();
}

void FakeHost::add_file(const std::string& path, Bytes contents)
{
    const auto size = static_cast<int64_t>(contents.size());
    add_sparse_file(path, size, {{0, std::move(contents)}});
}

bool FakeHost::grow(int64_t n, const std::string& path)
{
    const int64_t before = visible(path);
    set_visible(before + n, path);
    return visible(path) > before;
}

// The functions forward to the current host. The unused slots hold functions that must never run.
template <class Table> void FakeHost::fill(Table& table) const
{
    table.mem_slot1 = table.mem_slot3 = table.mem_slot5 = [] { violation("an unused memory function was called"); };
    table.mem_alloc = [](auto... args) { return current().alloc(args...); };
    table.mem_free = [](auto... args) { return current().release(args...); };
    table.mem_copy = [](auto... args) { return current().copy(args...); };
    table.mem_set = [](auto... args) { return current().set(args...); };
    table.file_open = [](auto... args) { return current().open(args...); };
    table.file_close = [](auto... args) { return current().close(args...); };
    table.file_read = [](auto... args) { return current().read(args...); };
    table.file_write = [](auto... args) { return current().write(args...); };
    table.file_eof = [](auto... args) { return current().eof(args...); };
    table.file_flush = [](auto... args) { return current().flush(args...); };
    table.file_seek = [](auto... args) { return current().seek(args..., false); };
    table.file_tell = [](auto... args) { return static_cast<int32_t>(current().tell(args..., false)); };
    table.file_seek64 = [](auto... args) { return current().seek(args..., true); };
    table.file_tell64 = [](auto... args) { return current().tell(args..., true); };
    if (m_only_32)
        std::tie(table.file_seek64, table.file_tell64) = std::pair(nullptr, nullptr);
}

flvd_init_t FakeHost::init(uint32_t options, uint32_t cache_size, uint32_t scan_read_size, const char* path) const
{
    flvd_init_t init;
    std::memset(static_cast<void*>(&init), 0x5A, sizeof(init));
    fill(init);
    std::tie(init.file_name, init.options, init.cache_size, init.scan_read_size) =
        std::tie(path, options, cache_size, scan_read_size);
    return init;
}

fio_funcs_t FakeHost::funcs() const
{
    fio_funcs_t table{};
    fill(table);
    return table;
}

fio_file_t* FakeHost::open_reader(const ReaderOptions& options) const
{
    const fio_funcs_t table = funcs();
    __FLV_DMX__fioSetFunc(&table);
    return __FLV_DMX__fioOpen(DEFAULT_FILE, options.mode, options.cache_size, options.overread, options.extra);
}

// Counts the call. Returns false if it has to fail.
bool FakeHost::begin(HostFn fn)
{
    if (on_call)
        on_call(fn);
    const uint64_t number = ++m_counts.calls[index(fn)];
    if (fn == HostFn::Free || fn == HostFn::Copy || fn == HostFn::Set || fn == HostFn::Eof || fn == HostFn::Close)
        return true; // these cannot fail
    const auto& [first, last] = m_faults.failing[index(fn)];
    return ++m_counts.failable != m_faults.call && (number < first || number > last);
}

uint32_t FakeHost::limited(HostFn fn, uint32_t count) const
{
    const auto& [nth, bytes] = m_faults.shortened[index(fn)];
    return nth == calls(fn) || nth == EACH ? std::min(count, bytes) : count;
}

void FakeHost::log(bool wanted, const char* name, const std::string& arguments, const std::string& result)
{
    if (wanted)
        m_log += (m_log.empty() ? "" : " ") + std::string(name) + "(" + arguments + ")=" + result;
}

FakeHost::Handle& FakeHost::handle(void* pointer)
{
    const auto handle = m_handles.find(pointer);
    if (handle != m_handles.end())
        return handle->second;
    violation("use of a handle that is not open");
    return m_none;
}

// A range that starts in one of the blocks must end in it. Other memory is not known here.
void FakeHost::check_range(const char* what, const void* pointer, uint32_t count)
{
    const auto* const begin = static_cast<const uint8_t*>(pointer);
    const auto after = m_blocks.upper_bound(begin);
    if (after == m_blocks.begin())
        return;
    const auto& [block, size] = *std::prev(after);
    const auto offset = static_cast<size_t>(begin - block);
    if (offset < size && count > size - offset)
        violation(std::string(what) + " " + std::to_string(count) + " bytes at " + std::to_string(offset) + " of " +
                  std::to_string(size));
}

void* FakeHost::alloc(uint32_t size)
{
    const bool allowed = begin(HostFn::Alloc) && size <= HUGE_BLOCK;
    void* const memory = allowed ? std::malloc(size != 0 ? size : 1) : nullptr;
    log(m_log_memory, "alloc", std::to_string(size), memory != nullptr ? "1" : "0");
    if (memory == nullptr)
        return nullptr;
    std::memset(memory, FRESH_MEMORY, size);
    m_blocks[static_cast<uint8_t*>(memory)] = size;
    return memory;
}

void FakeHost::release(void* memory)
{
    begin(HostFn::Free);
    log(m_log_memory, "free", memory != nullptr ? "1" : "0", "");
    if (memory == nullptr)
        return;
    const auto block = m_blocks.find(static_cast<uint8_t*>(memory));
    if (block == m_blocks.end())
        return violation("release of memory that is not allocated");
    if (on_release)
        on_release(memory, block->second);
    std::memset(memory, RELEASED_MEMORY, block->second);
    m_blocks.erase(block);
    std::free(memory);
}

void* FakeHost::copy(void* destination, const void* source, uint32_t count)
{
    begin(HostFn::Copy);
    log(m_log_memory, "copy", std::to_string(count), "");
    if (count == 0)
        violation("copy of 0 bytes");
    const auto to = reinterpret_cast<uintptr_t>(destination), from = reinterpret_cast<uintptr_t>(source);
    if (to < from ? from - to < count : to - from < count)
        violation("copy between overlapping ranges");
    check_range("copy to", destination, count);
    check_range("copy from", source, count);
    return std::memcpy(destination, source, count);
}

void* FakeHost::set(void* destination, int value, uint32_t count)
{
    begin(HostFn::Set);
    log(m_log_memory, "set", std::to_string(value) + "," + std::to_string(count), "");
    check_range("fill of", destination, count);
    return std::memset(destination, value, count);
}

void* FakeHost::open(const char* path, const char* mode)
{
    const bool allowed = begin(HostFn::Open);
    if (allowed && mode[0] == 'w')
        add_file(path, {});
    const auto file = m_files.find(path);
    if (!logged("open", std::string(path) + "," + mode, allowed && file != m_files.end()))
        return nullptr;
    void* const pointer = &m_pointers.emplace_back();
    m_handles[pointer].file = file->second;
    return pointer;
}

int32_t FakeHost::close(void* pointer)
{
    begin(HostFn::Close);
    handle(pointer);
    m_handles.erase(pointer);
    return logged("close", "", 0);
}

int32_t FakeHost::eof(void* pointer)
{
    begin(HostFn::Eof);
    return logged("eof", "", handle(pointer).eof ? 1 : 0);
}

int32_t FakeHost::flush(void* pointer)
{
    const bool allowed = begin(HostFn::Flush);
    handle(pointer);
    return logged("flush", "", allowed ? 0 : -1);
}

void FakeHost::fetch(const File& file, int64_t pos, uint8_t* out, uint32_t count)
{
    std::fill_n(out, count, uint8_t{0});
    for (const auto& [offset, bytes] : file.extents) {
        const int64_t from = std::max(pos, offset);
        const int64_t to = std::min(pos + count, offset + static_cast<int64_t>(bytes.size()));
        if (from < to)
            std::copy(bytes.data() + (from - offset), bytes.data() + (to - offset), out + (from - pos));
    }
}

// The handle of a read or write.
FakeHost::Handle& FakeHost::transfer(const char* what, const void* buffer, uint32_t size, uint32_t count, void* pointer)
{
    if (size != 1)
        violation(std::string(what) + " elements of size " + std::to_string(size));
    check_range(what, buffer, count);
    return handle(pointer);
}

// Like fread in a C library: short only at the end, which sets the end flag; while the flag is set, nothing is read.
uint32_t FakeHost::read(void* buffer, uint32_t size, uint32_t count, void* pointer)
{
    const bool allowed = begin(HostFn::Read);
    Handle& from = transfer("read of", buffer, size, count, pointer);
    uint32_t got = 0;
    if (allowed && !from.eof) {
        const int64_t left = std::max<int64_t>(from.file->visible - from.pos, 0);
        got = limited(HostFn::Read, static_cast<uint32_t>(std::min<int64_t>(left, count)));
        fetch(*from.file, from.pos, static_cast<uint8_t*>(buffer), got);
        from.pos += got;
        from.eof = left < count && got == left;
    }
    m_counts.bytes_read += got;
    return logged("read", std::to_string(count), got);
}

uint32_t FakeHost::write(const void* buffer, uint32_t size, uint32_t count, void* pointer)
{
    const bool allowed = begin(HostFn::Write);
    Handle& to = transfer("write of", buffer, size, count, pointer);
    const uint32_t done = allowed ? limited(HostFn::Write, count) : 0;
    if (done != 0) {
        Bytes& data = to.file->extents[0];
        data.resize(std::max(data.size(), static_cast<size_t>(to.pos) + done));
        std::copy_n(static_cast<const uint8_t*>(buffer), done, data.begin() + static_cast<std::ptrdiff_t>(to.pos));
        to.pos += done;
        to.file->size = to.file->visible = static_cast<int64_t>(data.size());
    }
    return logged("write", std::to_string(count), done);
}

int32_t FakeHost::seek(void* pointer, int64_t offset, int32_t whence, bool wide)
{
    bool done = begin(HostFn::Seek);
    Handle& moved = handle(pointer);
    const int64_t bases[] = {0, moved.pos, moved.file->visible};
    int64_t target = -1;
    done = done && whence >= FIO_SEEK_SET && whence <= FIO_SEEK_END &&
           !__builtin_add_overflow(bases[whence], offset, &target) && target >= 0 && (wide || target <= INT32_MAX);
    if (done)
        std::tie(moved.pos, moved.eof) = std::pair(target, false);
    const std::string arguments = std::to_string(offset) + "," + std::to_string(whence);
    return logged(wide ? "seek64" : "seek", arguments, done ? 0 : -1);
}

int64_t FakeHost::tell(void* pointer, bool wide)
{
    const bool allowed = begin(HostFn::Tell);
    const int64_t position = handle(pointer).pos;
    const int64_t told = allowed && (wide || position <= INT32_MAX) ? position : -1;
    return logged(wide ? "tell64" : "tell", "", on_tell ? on_tell(told) : told);
}

} // namespace flvd_test
