/*
 * A host in memory, with files, memory functions and file functions. They can be made to fail, count and log every
 * call, and check the contract: every block and handle is released once and not used afterwards, copies are not empty,
 * and reads stay inside the block in which they start.
 *
 * The library's tables carry no context, so there is one current host: the newest FakeHost object, while it exists.
 * Breaches of the contract, and anything still held when the host is destroyed, are reported to the violation handler.
 * Without one, they are printed and the process aborts. Include report.h in a GoogleTest source to make them fail the
 * test.
 */
#pragma once

#include "flvdmx/flvdmx.h"

#include "flv_writer.h"

#include <algorithm>
#include <array>
#include <deque>
#include <functional>
#include <map>
#include <memory>
#include <string>
#include <tuple>

namespace flvd_test {

/** Seek and Tell stand for the 32- and the 64-bit function; in the log they differ. */
enum class HostFn { Alloc, Free, Copy, Set, Open, Close, Read, Write, Seek, Tell, Eof, Flush, Count };

/** The sizes with which the library's file layer opens a file. */
struct ReaderOptions {
    uint32_t cache_size;
    int32_t overread = 0;
    uint32_t extra = 0;
    uint32_t mode = FIO_MODE_READ | FIO_MODE_BINARY;
};

/** A call of a function that fails: null, -1, 0 bytes, 0 elements. With `later`, all calls after it fail, too. */
struct HostFault {
    HostFn fn = HostFn::Read;
    uint64_t nth = 0; /**< 0: none */
    bool later = false;
};

class FakeHost {
public:
    FakeHost() { m_current = this; }
    /** A host with one file, "a.flv". */
    explicit FakeHost(Bytes file) : FakeHost() { add_file(DEFAULT_FILE, std::move(file)); }
    virtual ~FakeHost();
    FakeHost(const FakeHost&) = delete;
    FakeHost& operator=(const FakeHost&) = delete;

    static FakeHost& current() { return *m_current; }
    using ViolationHandler = void (*)(const std::string& what);
    static void set_violation_handler(ViolationHandler handler) { m_handler = handler; }

    /* -- files */

    static constexpr const char* DEFAULT_FILE = "a.flv";
    void add_file(const std::string& path, Bytes contents);
    /** A file of `size` bytes: zeros, except for the given extents {offset: bytes}. May be far larger than 4 GiB. */
    void add_sparse_file(const std::string& path, int64_t size, std::map<int64_t, Bytes> extents)
    {
        m_files[path] = std::make_shared<File>(File{std::move(extents), size, size});
    }
    /** Makes only the first `size` bytes visible (at most all), like a growing file. Open handles see it at once. */
    void set_visible(int64_t size, const std::string& path = DEFAULT_FILE)
    {
        m_files.at(path)->visible = std::min(size, m_files.at(path)->size);
    }
    /** Makes n more bytes visible. @return false if everything was visible already */
    bool grow(int64_t n, const std::string& path = DEFAULT_FILE);
    int64_t visible(const std::string& path = DEFAULT_FILE) const { return m_files.at(path)->visible; }
    /** The contents of a file that is not sparse. */
    const Bytes& contents(const std::string& path = DEFAULT_FILE) const { return m_files.at(path)->extents.at(0); }

    /* -- tables for the library */

    /** An initialisation block; words that the library must not read contain garbage. */
    flvd_init_t init(uint32_t options = 0, uint32_t cache_size = 0, uint32_t scan_read_size = 0,
                     const char* path = DEFAULT_FILE) const;
    fio_funcs_t funcs() const;
    /** Omits the 64-bit functions; the 32-bit ones then fail beyond 2 GiB. Call it before init() or funcs(). */
    void use_32_bit_only() { m_only_32 = true; }

    /** Gives the library's file layer this host's functions and opens the file, which the caller must close. */
    fio_file_t* open_reader(const ReaderOptions& options) const;

    /* -- faults. Calls are numbered from 1, starting at the construction or the last reset_calls(). */

    void fail(const HostFault& fault)
    {
        m_faults.failing[index(fault.fn)] = {fault.nth, fault.later && fault.nth != 0 ? UINT64_MAX : fault.nth};
    }
    void fail_nth(HostFn fn, uint64_t n) { fail({fn, n}); }
    void fail_from(HostFn fn, uint64_t n) { fail({fn, n, true}); }
    /** The nth call of a function that can fail (alloc, open, read, write, seek, tell, flush) fails. */
    void fail_nth_call(uint64_t n) { m_faults.call = n; }
    void fail_nothing() { m_faults = {}; }
    /** The nth read or write moves at most k bytes. */
    void shorten_nth(HostFn fn, uint64_t n, uint32_t k) { m_faults.shortened[index(fn)] = {n, k}; }
    /** Every read moves at most k bytes. */
    void limit_reads(uint32_t k) { m_faults.shortened[index(HostFn::Read)] = {EACH, k}; }
    /** Called at the start of every host function, before it counts. Lets a file grow in the middle of a request. */
    std::function<void(HostFn)> on_call;
    /** If set, changes every position that is returned. */
    std::function<int64_t(int64_t position)> on_tell;
    /** Called with every released block, before its contents are overwritten. */
    std::function<void(const void* block, uint32_t size)> on_release;

    /* -- what happened */

    uint64_t calls(HostFn fn) const { return m_counts.calls[index(fn)]; }
    /** The number of calls of functions that can fail. */
    uint64_t failable_calls() const { return m_counts.failable; }
    /** The number of reads, writes, seeks and tells. */
    uint64_t io_calls() const
    {
        return calls(HostFn::Read) + calls(HostFn::Write) + calls(HostFn::Seek) + calls(HostFn::Tell);
    }
    uint64_t bytes_read() const { return m_counts.bytes_read; }
    void reset_calls() { std::tie(m_counts, m_log) = std::pair(Counts{}, ""); }
    /** Starts a log of all file calls, with `memory` also of memory calls. */
    void start_log(bool memory = false) { std::tie(m_logging, m_log_memory, m_log) = std::tuple(true, memory, ""); }
    /**
     * Returns the log so far and empties it. Entries are `name(arguments)=result`, separated by a space:
     * open(a.flv,rb)=1 read(4096)=100 write(8)=8 seek(10,1)=0 seek64(10,0)=0 tell()=5 tell64()=5 eof()=1 flush()=0
     * close()=0 alloc(64)=1 free(1)= copy(16)= set(0,16)=. Blocks appear as 1, null as 0.
     */
    std::string take_log() { return std::exchange(m_log, {}); }

    /** The size of an allocated block; 0 for any other pointer. */
    size_t size_of(const void* block) const
    {
        const auto held = m_blocks.find(static_cast<const uint8_t*>(block));
        return held != m_blocks.end() ? held->second : 0;
    }
    size_t live_blocks() const { return m_blocks.size(); }
    size_t open_handles() const { return m_handles.size(); }

protected:
    virtual int32_t eof(void* pointer);
    virtual uint32_t read(void* buffer, uint32_t size, uint32_t count, void* pointer);
    virtual int32_t seek(void* pointer, int64_t offset, int32_t whence, bool wide);
    virtual int64_t tell(void* pointer, bool wide);

private:
    struct File {
        std::map<int64_t, Bytes> extents;
        int64_t size = 0;
        int64_t visible = 0;
    };
    struct Handle {
        std::shared_ptr<File> file;
        int64_t pos = 0;
        bool eof = false;
    };
    static constexpr uint64_t EACH = UINT64_MAX; // of the calls
    template <class Value> using OfEach = std::array<Value, static_cast<size_t>(HostFn::Count)>;
    struct Counts {
        OfEach<uint64_t> calls{};
        uint64_t failable = 0, bytes_read = 0;
    };
    struct Faults {
        OfEach<std::pair<uint64_t, uint64_t>> failing{}; // first and last call that fails
        OfEach<std::pair<uint64_t, uint32_t>> shortened{};
        uint64_t call = 0;
    };
    static size_t index(HostFn fn) { return static_cast<size_t>(fn); }

    static void violation(const std::string& what);
    bool begin(HostFn fn);
    uint32_t limited(HostFn fn, uint32_t count) const;
    void log(bool wanted, const char* name, const std::string& arguments, const std::string& result);
    template <class Result> Result logged(const char* name, const std::string& arguments, Result result)
    {
        log(m_logging, name, arguments, std::to_string(result));
        return result;
    }
    template <class Table> void fill(Table& table) const;
    Handle& handle(void* pointer);
    void check_range(const char* what, const void* pointer, uint32_t count);
    Handle& transfer(const char* what, const void* buffer, uint32_t size, uint32_t count, void* pointer);

    void* alloc(uint32_t size);
    void release(void* memory);
    void* copy(void* destination, const void* source, uint32_t count);
    void* set(void* destination, int value, uint32_t count);
    void* open(const char* path, const char* mode);
    int32_t close(void* pointer);
    int32_t flush(void* pointer);
    uint32_t write(const void* buffer, uint32_t size, uint32_t count, void* pointer);
    static void fetch(const File& file, int64_t pos, uint8_t* out, uint32_t count);

    static inline ViolationHandler m_handler = nullptr;
    static inline FakeHost* m_current = nullptr;
    FakeHost* const m_previous = m_current;
    std::map<std::string, std::shared_ptr<File>> m_files;
    std::map<const void*, Handle> m_handles;
    std::deque<uint8_t> m_pointers; // one for each handle ever opened, so that a closed one is not mistaken for another
    std::map<const uint8_t*, uint32_t> m_blocks;
    Counts m_counts;
    Faults m_faults;
    Handle m_none = {std::make_shared<File>()}; // used instead of a handle that is not open
    bool m_only_32 = false, m_logging = false, m_log_memory = false;
    std::string m_log;
};

} // namespace flvd_test
