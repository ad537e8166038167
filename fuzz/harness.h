/*
 * What the fuzz targets share: the input, the list of targets, a host that lies, and require(), which prints a message
 * and aborts when a check fails.
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
    /** The next control byte; 0 when there are no more. */
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

enum class Lie : uint8_t {
    ReadClaimsMore,   /**< claims more bytes than were requested */
    ReadStands,       /**< does not advance the position */
    TellGoesBack,     /**< returns too low a position every other time */
    TellStands,       /**< always returns the same position */
    TellHuge,         /**< returns a position that no file has */
    SeekForgetsWhere, /**< takes every offset from the start */
    SeekStands,       /**< succeeds without moving */
    NeverAtEnd,
    AlwaysAtEnd,
    Count
};

/** The fake host with lies and a limit on its calls. Only one may exist at a time. */
class Host : public FakeHost {
public:
    explicit Host(Bytes file);
    /** Tells these lies (bits 1 << Lie) until `patience` calls or KiB read are used up; after that its calls fail. */
    void lie(uint32_t lies, uint64_t patience) { std::tie(m_lies, m_patience) = std::tie(lies, patience); }
    /** Sets how many host calls the next operation may make. */
    void begin(uint64_t calls) { m_calls_left = calls; }
    /** Where a reader really stands. */
    int64_t position(const fio_file_t* reader);
    void require_clean() const { require(live_blocks() + open_handles() == 0, "memory or a file was not released"); }

private:
    bool lies(Lie lie) const { return (m_lies >> static_cast<uint32_t>(lie) & 1u) != 0; }
    bool refuses(uint64_t effort);
    int32_t eof(void* handle) override;
    uint32_t read(void* buffer, uint32_t size, uint32_t count, void* handle) override;
    int32_t seek(void* handle, int64_t offset, int32_t whence, bool wide) override;
    int64_t tell(void* handle, bool wide) override;

    uint32_t m_lies = 0;
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
/** False when fewer than 13 bytes are left. */
bool read_tag(const Bytes& file, int64_t position, FileTag* tag);

} // namespace flvd_fuzz
