/*
 * What the fuzz targets share: the input, the list of targets, a host that lies, and the judgement itself: one that
 * does not hold ends the process.
 */
#pragma once

#include "support/fake_host.h"

#include <algorithm>
#include <array>

namespace flvd_fuzz {

using namespace flvd_test;

void require(bool holds, const char* what);

/**
 * What the fuzzer gave: a payload, control bytes, and in the last byte their number. The payload comes first so
 * that its offsets stay when commands are added.
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

/** A course: the control bytes are its calls, each a code and an argument. */
template <class Course, uint32_t MAX_CALLS> void run_calls(Input& input)
{
    Course course(input);
    for (uint32_t i = 0; i < MAX_CALLS && !input.empty(); ++i) {
        const uint8_t code = input.byte();
        course.call(code, input.byte());
    }
}

/** A fuzz target. Each is a static object; the programs find what it runs by its name. */
struct Target {
    Target(const char* name, void (*run)(Input&)) { all[name] = run; }
    static inline std::map<std::string, void (*)(Input&)> all;
};

enum class Lie : uint8_t {
    ReadClaimsMore,   /**< more bytes than were asked for */
    ReadStands,       /**< the position does not follow */
    TellGoesBack,     /**< every other position is too low */
    TellStands,       /**< always the same position */
    TellHuge,         /**< a position that no file has */
    SeekForgetsWhere, /**< every offset counts from the start */
    SeekStands,       /**< success without moving */
    NeverAtEnd,
    AlwaysAtEnd,
    Count
};

/** The fake host with lies, and with a limit to its calls. One at a time. */
class Host : public FakeHost {
public:
    explicit Host(Bytes file);
    /** Tells these lies (bits 1 << Lie) until `patience` calls or KiB read are used up; from then on it refuses. */
    void lie(uint32_t lies, uint64_t patience) { std::tie(m_lies, m_patience) = std::tie(lies, patience); }
    /** The next operation may cost so many calls. */
    void begin(uint64_t calls) { m_calls_left = calls; }
    /** Where a reader really stands. */
    int64_t position(const fio_file_t* reader);
    void require_clean() const { require(live_blocks() + open_handles() == 0, "memory or a file that was kept"); }

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

/** A copy: reads it all, so that a sanitizer sees what is not there. */
Bytes copy_of(const void* begin, size_t size);
template <class Record> Bytes bytes_of(const Record& record)
{
    return copy_of(&record, sizeof record);
}

/** A tag as it stands in a file, read anew from the bytes. */
struct FileTag {
    uint32_t type, size, timestamp, stream_id, first, second; /**< first, second: data bytes */
    bool video() const { return type == FLVD_TAG_TYPE_VIDEO; }
    bool keyframe() const { return first / 16 == 1 || first / 16 == 4; }
};
uint32_t read_be(const uint8_t* bytes, size_t count);
/** False when fewer than 13 bytes are there. */
bool read_tag(const Bytes& file, int64_t position, FileTag* tag);

} // namespace flvd_fuzz
