/*
 * Shared by the fuzz targets: the input, the list of targets, a host that can break its contract, and require(), which
 * prints a message and aborts if a check fails.
 */
#pragma once

#include "support/fake_host.h"

#include <algorithm>
#include <array>

namespace flvd_fuzz {

using namespace flvd_test;

void require(bool holds, const char* what);

/**
 * The fuzzer's input: a payload, control bytes, and a last byte with the number of control bytes. The payload comes
 * first so that its offsets do not change when commands are added.
 */
class Input {
public:
    Input(const uint8_t* data, size_t size);
    const Bytes& payload() const { return m_payload; }
    bool empty() const { return m_next == m_control.size(); }
    /** Returns the next control byte; 0 if there are no more. */
    uint8_t byte() { return empty() ? uint8_t{0} : m_control[m_next++]; }
    uint16_t word()
    {
        const uint8_t high = byte();
        return static_cast<uint16_t>(high << 8 | byte());
    }

private:
    Bytes m_payload, m_control;
    size_t m_next = 0;
};

/** Runs a sequence of calls on a Course; each call is a code and an argument from the control bytes. */
template <class Course, uint32_t MAX_CALLS> void run_calls(Input& input)
{
    Course course(input);
    for (uint32_t i = 0; i < MAX_CALLS && !input.empty(); ++i) {
        const uint8_t code = input.byte();
        course.call(code, input.byte());
    }
}

/** A fuzz target. Each is a static object that registers its function by name. */
struct Target {
    Target(const char* name, void (*run)(Input&)) { all[name] = run; }
    static inline std::map<std::string, void (*)(Input&)> all;
};

enum class Breach : uint8_t {
    ReadClaimsMore,    /**< claims more bytes than were requested */
    ReadStays,         /**< does not advance the position */
    TellGoesBack,      /**< returns too low a position every other time */
    TellStays,         /**< always returns the same position */
    TellHuge,          /**< returns a position that no file has */
    SeekIgnoresWhence, /**< counts every offset from the start */
    SeekStays,         /**< succeeds without moving */
    NeverAtEnd,
    AlwaysAtEnd,
    Count
};

/** The fake host with breaches of its contract and a limit on its calls. Only one may exist at a time. */
class Host : public FakeHost {
public:
    explicit Host(Bytes file);
    /** Breaks the contract in these ways (bits 1 << Breach) until `patience` calls or KiB read are used up; after that,
     *  its calls fail. */
    void break_contract(uint32_t breaches, uint64_t patience)
    {
        std::tie(m_breaches, m_patience) = std::tie(breaches, patience);
    }
    /** Sets how many host calls the next operation may make. */
    void begin(uint64_t calls) { m_calls_left = calls; }
    /** Returns the true position of a reader. */
    int64_t position(const fio_file_t* reader);
    void require_clean() const { require(live_blocks() + open_handles() == 0, "memory or a file was not released"); }

private:
    bool breaks(Breach breach) const { return (m_breaches >> static_cast<uint32_t>(breach) & 1u) != 0; }
    bool refuses(uint64_t effort);
    int32_t eof(void* handle) override;
    uint32_t read(void* buffer, uint32_t size, uint32_t count, void* handle) override;
    int32_t seek(void* handle, int64_t offset, int32_t whence, bool wide) override;
    int64_t tell(void* handle, bool wide) override;

    uint32_t m_breaches = 0;
    uint64_t m_patience = UINT64_MAX, m_calls_left = UINT64_MAX;
};

/** Copies the bytes; reading them all lets a sanitizer find invalid memory. */
Bytes copy_of(const void* begin, size_t size);
inline const auto bytes_of = [](const auto& record) { return copy_of(&record, sizeof record); };

/** A tag parsed from the bytes of a file, independently of the library. */
struct FileTag {
    uint32_t type, size, timestamp, stream_id, first, second; /**< first, second: its first two data bytes */
    bool video() const { return type == FLVD_TAG_TYPE_VIDEO; }
    bool keyframe() const { return first / 16 == 1 || first / 16 == 4; }
};
uint32_t read_be(const uint8_t* bytes, size_t count);
/** Returns false if fewer than 13 bytes are left. */
bool read_tag(const Bytes& file, int64_t position, FileTag* tag);

} // namespace flvd_fuzz
