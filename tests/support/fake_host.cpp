#include "fake_host.h"

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <cstring>

namespace flvd_test {

static constexpr uint32_t HUGE_BLOCK = 64u << 20;
static constexpr uint8_t FRESH_MEMORY = 0xA5;
static constexpr uint8_t RELEASED_MEMORY = 0xDD;

static FakeHost* g_current = nullptr;
static FakeHost::ViolationHandler g_handler = nullptr;

// The tables' functions pass on to the current host. The carried slots are functions that must never run.
struct FakeHost::Functions {
    static void* Alloc(uint32_t size) { return current().alloc(size); }
    static void Free(void* memory) { current().release(memory); }
    static void* Copy(void* destination, const void* source, uint32_t count)
    {
        FakeHost& host = current();
        host.begin(HostFn::Copy);
        host.log_memory("copy", std::to_string(count), "");
        if (count == 0)
            violation("copy of 0 bytes");
        const auto to = reinterpret_cast<uintptr_t>(destination);
        const auto from = reinterpret_cast<uintptr_t>(source);
        if (to < from ? from - to < count : to - from < count)
            violation("copy between overlapping ranges");
        host.check_range("copy to", destination, count);
        host.check_range("copy from", source, count);
        return std::memcpy(destination, source, count);
    }
    static void* Set(void* destination, int value, uint32_t count)
    {
        FakeHost& host = current();
        host.begin(HostFn::Set);
        host.log_memory("set", std::to_string(value) + "," + std::to_string(count), "");
        host.check_range("fill of", destination, count);
        return std::memset(destination, value, count);
    }
    template <int slot> static void Carried()
    {
        violation("carried memory function " + std::to_string(slot) + " was called");
    }
    static void* Open(const char* path, const char* mode) { return current().open(path, mode); }
    static int32_t Close(void* pointer) { return current().close(pointer); }
    static uint32_t Read(void* buffer, uint32_t size, uint32_t count, void* pointer)
    {
        return current().read(buffer, size, count, pointer);
    }
    static uint32_t Write(const void* buffer, uint32_t size, uint32_t count, void* pointer)
    {
        return current().write(buffer, size, count, pointer);
    }
    static int32_t Seek(void* pointer, int32_t offset, int32_t whence)
    {
        return current().seek(pointer, offset, whence, false);
    }
    static int32_t Seek64(void* pointer, int64_t offset, int32_t whence)
    {
        return current().seek(pointer, offset, whence, true);
    }
    static int32_t Tell(void* pointer) { return static_cast<int32_t>(current().tell(pointer, false)); }
    static int64_t Tell64(void* pointer) { return current().tell(pointer, true); }
    static int32_t Eof(void* pointer)
    {
        FakeHost& host = current();
        host.begin(HostFn::Eof);
        const Handle* const handle = host.handle(pointer);
        const int32_t result = handle != nullptr && handle->eof ? 1 : 0;
        host.log("eof", result);
        return result;
    }
    static int32_t Flush(void* pointer)
    {
        FakeHost& host = current();
        const int32_t result = host.begin(HostFn::Flush) && host.handle(pointer) != nullptr ? 0 : -1;
        host.log("flush", result);
        return result;
    }
};

FakeHost::FakeHost() : m_previous(g_current)
{
    g_current = this;
}

FakeHost::FakeHost(Bytes file) : FakeHost()
{
    add_file(DEFAULT_FILE, std::move(file));
}

FakeHost::~FakeHost()
{
    if (live_blocks() != 0)
        violation(std::to_string(live_blocks()) + " blocks were not released");
    if (open_handles() != 0)
        violation(std::to_string(open_handles()) + " files were not closed");
    for (const auto& [block, size] : m_blocks)
        std::free(const_cast<uint8_t*>(block));
    g_current = m_previous;
}

FakeHost& FakeHost::current()
{
    if (g_current == nullptr)
        std::abort();
    return *g_current;
}

void FakeHost::set_violation_handler(ViolationHandler handler)
{
    g_handler = handler;
}

void FakeHost::violation(const std::string& what)
{
    if (g_handler != nullptr) {
        g_handler(what);
        return;
    }
    std::fprintf(stderr, "fake host: %s\n", what.c_str());
    std::abort();
}

void FakeHost::add_file(const std::string& path, Bytes contents)
{
    auto file = std::make_shared<File>();
    file->size = file->visible = static_cast<int64_t>(contents.size());
    file->data = std::move(contents);
    m_files[path] = std::move(file);
}

void FakeHost::add_sparse_file(const std::string& path, int64_t size, std::map<int64_t, Bytes> extents)
{
    auto file = std::make_shared<File>();
    file->size = file->visible = size;
    file->extents = std::move(extents);
    m_files[path] = std::move(file);
}

void FakeHost::set_visible(int64_t size, const std::string& path)
{
    File& file = *m_files.at(path);
    file.visible = std::min(size, file.size);
}

bool FakeHost::grow(int64_t n, const std::string& path)
{
    const int64_t before = visible(path);
    set_visible(before + n, path);
    return visible(path) > before;
}

flvd_init_t FakeHost::init(uint32_t options, uint32_t cache_size, uint32_t scan_read_size, const char* path) const
{
    flvd_init_t init;
    std::memset(static_cast<void*>(&init), 0x5A, sizeof(init));
    const fio_funcs_t table = funcs();
    init.mem_alloc = table.mem_alloc;
    init.mem_free = table.mem_free;
    init.mem_slot3 = table.mem_slot3;
    init.mem_copy = table.mem_copy;
    init.mem_slot5 = table.mem_slot5;
    init.mem_set = reinterpret_cast<flvd_mem_set_fn>(table.mem_set);
    init.mem_slot1 = table.mem_slot1;
    init.file_open = table.file_open;
    init.file_read = table.file_read;
    init.file_seek = table.file_seek;
    init.file_tell = table.file_tell;
    init.file_close = table.file_close;
    init.file_eof = table.file_eof;
    init.file_flush = table.file_flush;
    init.file_write = table.file_write;
    init.file_seek64 = table.file_seek64;
    init.file_tell64 = table.file_tell64;
    init.file_name = path;
    init.options = options;
    init.cache_size = cache_size;
    init.scan_read_size = scan_read_size;
    return init;
}

fio_funcs_t FakeHost::funcs() const
{
    fio_funcs_t table{};
    table.mem_alloc = Functions::Alloc;
    table.mem_slot1 = Functions::Carried<1>;
    table.mem_free = Functions::Free;
    table.mem_slot3 = Functions::Carried<3>;
    table.mem_copy = Functions::Copy;
    table.mem_slot5 = Functions::Carried<5>;
    table.mem_set = Functions::Set;
    table.file_open = Functions::Open;
    table.file_close = Functions::Close;
    table.file_read = Functions::Read;
    table.file_write = Functions::Write;
    table.file_seek = Functions::Seek;
    table.file_tell = Functions::Tell;
    table.file_eof = Functions::Eof;
    table.file_flush = Functions::Flush;
    table.file_seek64 = m_only_32 ? nullptr : Functions::Seek64;
    table.file_tell64 = m_only_32 ? nullptr : Functions::Tell64;
    return table;
}

void FakeHost::fail_nothing()
{
    m_faults = {};
    m_shortened = {};
    m_fail_call = 0;
    m_read_limit = UINT32_MAX;
}

uint64_t FakeHost::io_calls() const
{
    return calls(HostFn::Read) + calls(HostFn::Write) + calls(HostFn::Seek) + calls(HostFn::Tell);
}

void FakeHost::reset_calls()
{
    m_calls = {};
    m_failable_calls = 0;
    m_bytes_read = 0;
    m_log.clear();
}

void FakeHost::start_log(bool memory)
{
    m_logging = true;
    m_log_memory = memory;
    m_log.clear();
}

std::string FakeHost::take_log()
{
    return std::exchange(m_log, {});
}

size_t FakeHost::live_bytes() const
{
    size_t sum = 0;
    for (const auto& [block, size] : m_blocks)
        sum += size;
    return sum;
}

size_t FakeHost::open_handles() const
{
    return static_cast<size_t>(
        std::count_if(m_handles.begin(), m_handles.end(), [](const auto& handle) { return handle->open; }));
}

static bool CanFail(HostFn fn)
{
    return fn != HostFn::Free && fn != HostFn::Copy && fn != HostFn::Set && fn != HostFn::Eof && fn != HostFn::Close;
}

// Counts the call. False: it has to fail.
bool FakeHost::begin(HostFn fn)
{
    if (on_call)
        on_call(fn);
    const uint64_t number = ++m_calls[index(fn)];
    if (!CanFail(fn))
        return true;
    const Range& fault = m_faults[index(fn)];
    return ++m_failable_calls != m_fail_call && (fault.first == 0 || number < fault.first || number > fault.last);
}

uint32_t FakeHost::limited(HostFn fn, uint32_t count) const
{
    const Shortened& shortened = m_shortened[index(fn)];
    if (shortened.nth == m_calls[index(fn)])
        count = std::min(count, shortened.bytes);
    return fn == HostFn::Read ? std::min(count, m_read_limit) : count;
}

template <class... Args> void FakeHost::log(const char* name, int64_t result, const Args&... args)
{
    if (!m_logging)
        return;
    std::string list;
    ((list += (list.empty() ? "" : ",") + args), ...);
    m_log += (m_log.empty() ? "" : " ") + std::string(name) + "(" + list + ")=" + std::to_string(result);
}

void FakeHost::log_memory(const char* name, const std::string& arguments, const std::string& result)
{
    if (m_log_memory)
        m_log += (m_log.empty() ? "" : " ") + std::string(name) + "(" + arguments + ")=" + result;
}

FakeHost::Handle* FakeHost::handle(void* pointer)
{
    for (auto handle = m_handles.rbegin(); handle != m_handles.rend(); ++handle) // the newest are in use
        if (handle->get() == pointer && (*handle)->open)
            return handle->get();
    violation("use of a handle that is not open");
    return nullptr;
}

// Memory that begins in one of the blocks has to end in it. Memory of others is not known here.
void FakeHost::check_range(const char* what, const void* pointer, uint32_t count)
{
    const uint8_t* const begin = static_cast<const uint8_t*>(pointer);
    auto block = m_blocks.upper_bound(begin);
    if (block == m_blocks.begin())
        return;
    --block;
    const size_t offset = static_cast<size_t>(begin - block->first);
    if (offset < block->second && count > block->second - offset)
        violation(std::string(what) + " " + std::to_string(count) + " bytes at " + std::to_string(offset) + " of " +
                  std::to_string(block->second));
}

void* FakeHost::alloc(uint32_t size)
{
    const bool allowed = begin(HostFn::Alloc) && size <= HUGE_BLOCK;
    void* const memory = allowed ? std::malloc(size != 0 ? size : 1) : nullptr;
    log_memory("alloc", std::to_string(size), memory != nullptr ? "1" : "0");
    if (memory == nullptr)
        return nullptr;
    std::memset(memory, FRESH_MEMORY, size);
    m_blocks[static_cast<uint8_t*>(memory)] = size;
    return memory;
}

void FakeHost::release(void* memory)
{
    begin(HostFn::Free);
    log_memory("free", memory != nullptr ? "1" : "0", "");
    if (memory == nullptr)
        return;
    const auto block = m_blocks.find(static_cast<uint8_t*>(memory));
    if (block == m_blocks.end()) {
        violation("release of memory that is not held");
        return;
    }
    if (on_release)
        on_release(memory, block->second);
    std::memset(memory, RELEASED_MEMORY, block->second);
    m_blocks.erase(block);
    std::free(memory);
}

void* FakeHost::open(const char* path, const char* mode)
{
    m_open_modes.emplace_back(mode);
    const bool allowed = begin(HostFn::Open);
    if (allowed && mode[0] == 'w')
        add_file(path, {});
    const auto file = m_files.find(path);
    const bool opened = allowed && file != m_files.end();
    log("open", opened ? 1 : 0, std::string(path), std::string(mode));
    if (!opened)
        return nullptr;
    m_handles.push_back(std::make_unique<Handle>(Handle{file->second}));
    return m_handles.back().get();
}

int32_t FakeHost::close(void* pointer)
{
    begin(HostFn::Close);
    Handle* const closing = handle(pointer);
    if (closing != nullptr)
        closing->open = false;
    log("close", closing != nullptr ? 0 : -1);
    return closing != nullptr ? 0 : -1;
}

void FakeHost::fetch(const File& file, int64_t pos, uint8_t* out, uint32_t count)
{
    if (file.extents.empty()) {
        std::copy_n(file.data.begin() + static_cast<std::ptrdiff_t>(pos), count, out);
        return;
    }
    std::fill_n(out, count, uint8_t{0});
    for (const auto& [offset, bytes] : file.extents) {
        const int64_t from = std::max(pos, offset);
        const int64_t to = std::min(pos + count, offset + static_cast<int64_t>(bytes.size()));
        for (int64_t i = from; i < to; ++i)
            out[i - pos] = bytes[static_cast<size_t>(i - offset)];
    }
}

// As fread of a C library: short only at the end, which sets the end flag; with the flag set nothing is read.
uint32_t FakeHost::read(void* buffer, uint32_t size, uint32_t count, void* pointer)
{
    const bool allowed = begin(HostFn::Read);
    if (size != 1)
        violation("read with an element size of " + std::to_string(size));
    check_range("read of", buffer, count);
    Handle* const from = handle(pointer);
    uint32_t got = 0;
    if (allowed && from != nullptr && !from->eof) {
        const int64_t left = std::max<int64_t>(from->file->visible - from->pos, 0);
        from->eof = left < count;
        got = limited(HostFn::Read, static_cast<uint32_t>(std::min<int64_t>(left, count)));
        fetch(*from->file, from->pos, static_cast<uint8_t*>(buffer), got);
        from->pos += got;
        from->eof = from->eof && got == left;
    }
    m_bytes_read += got;
    log("read", got, std::to_string(count));
    return got;
}

uint32_t FakeHost::write(const void* buffer, uint32_t size, uint32_t count, void* pointer)
{
    const bool allowed = begin(HostFn::Write);
    if (size != 1)
        violation("write with an element size of " + std::to_string(size));
    check_range("write of", buffer, count);
    Handle* const to = handle(pointer);
    uint32_t done = 0;
    if (allowed && to != nullptr) {
        File& file = *to->file;
        done = limited(HostFn::Write, count);
        file.data.resize(std::max(file.data.size(), static_cast<size_t>(to->pos) + done));
        std::copy_n(static_cast<const uint8_t*>(buffer), done,
                    file.data.begin() + static_cast<std::ptrdiff_t>(to->pos));
        to->pos += done;
        file.size = file.visible = static_cast<int64_t>(file.data.size());
    }
    log("write", done, std::to_string(count));
    return done;
}

int32_t FakeHost::seek(void* pointer, int64_t offset, int32_t whence, bool wide)
{
    const bool allowed = begin(HostFn::Seek);
    Handle* const moved = handle(pointer);
    int32_t result = -1;
    if (allowed && moved != nullptr && whence >= FIO_SEEK_SET && whence <= FIO_SEEK_END) {
        const int64_t base = whence == FIO_SEEK_SET ? 0 : whence == FIO_SEEK_CUR ? moved->pos : moved->file->visible;
        int64_t target = 0;
        const bool reachable = !__builtin_add_overflow(base, offset, &target) && target >= 0;
        if (reachable && (wide || target <= INT32_MAX)) {
            moved->pos = target;
            moved->eof = false;
            result = 0;
        }
    }
    log(wide ? "seek64" : "seek", result, std::to_string(offset), std::to_string(whence));
    return result;
}

int64_t FakeHost::tell(void* pointer, bool wide)
{
    const bool allowed = begin(HostFn::Tell);
    const Handle* const asked = handle(pointer);
    const bool works = allowed && asked != nullptr && (wide || asked->pos <= INT32_MAX);
    const int64_t result = works ? asked->pos : -1;
    log(wide ? "tell64" : "tell", result);
    return result;
}

} // namespace flvd_test
