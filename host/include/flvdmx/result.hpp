/*
 * What the functions of flvdmx.hpp return: a value, or an error in its place. For C++17.
 */
#ifndef FLVDMX_RESULT_HPP
#define FLVDMX_RESULT_HPP

#include "flvdmx/error_text.h"

#include <cstddef>
#include <cstdint>
#include <utility>
#include <vector>

namespace flvdmx {

/** A view of bytes that someone else owns. */
class Bytes {
public:
    constexpr Bytes() = default;
    /** Views the `size` bytes at `data`. */
    constexpr Bytes(const uint8_t* data, size_t size) : m_data(data), m_size(size) {}
    /** Views all bytes of a vector, such as VideoInfo::config. */
    // Implicit, as for std::string_view, so that functions accept configurations and frames alike.
    // NOLINTNEXTLINE(google-explicit-constructor,hicpp-explicit-conversions)
    Bytes(const std::vector<uint8_t>& bytes) : m_data(bytes.data()), m_size(bytes.size()) {}
    constexpr const uint8_t* data() const { return m_data; }         /**< the first byte; may be null when empty */
    constexpr size_t size() const { return m_size; }                 /**< number of bytes */
    constexpr bool empty() const { return m_size == 0; }             /**< true when there are no bytes */
    constexpr const uint8_t* begin() const { return m_data; }        /**< the first byte */
    constexpr const uint8_t* end() const { return m_data + m_size; } /**< past the last byte */
    /** Byte `i`; 0 past the end. */
    constexpr uint8_t operator[](size_t i) const { return i < m_size ? m_data[i] : uint8_t{0}; }

private:
    const uint8_t* m_data = nullptr;
    size_t m_size = 0;
};

/** What a failure means for the caller. */
enum class Kind {
    none,    /**< no failure */
    end,     /**< the end of the data */
    not_yet, /**< a growing file has no more data yet: retry, or reopen it, later */
    miss,    /**< a seek missed; playing continues where it was, or at the end if requested */
    failed   /**< anything else */
};

/** A failure: error code and line number, their meaning, and errno if a file could not be opened. */
class error {
public:
    constexpr error() = default;
    /** From the library's code and line, and errno. */
    constexpr error(Kind kind, int32_t code, int32_t line, int system_error = 0)
        : m_kind(kind), m_code(code), m_line(line), m_system_error(system_error)
    {
    }

    constexpr Kind kind() const { return m_kind; }    /**< what it means for the caller */
    constexpr int32_t code() const { return m_code; } /**< FLVD_ERR_* of flvdmx.h or error_text.h */
    /** Line number that identifies the failure, the same in every release; 0: not a failure of the library. */
    constexpr int32_t line() const { return m_line; }
    /** errno when the host could not open the file (ENOENT, EACCES, ...), for strerror; else 0. */
    constexpr int system_error() const { return m_system_error; }
    const char* name() const { return flvd_error_name(m_code); } /**< such as "FLVD_ERR_SEEK" */
    const char* text() const { return flvd_error_text(m_code); } /**< a message for users */

private:
    Kind m_kind = Kind::none;
    int32_t m_code = FLVD_ERR_NONE;
    int32_t m_line = 0;
    int m_system_error = 0;
};

/**
 * A value, or an error in its place: test it before use. A missing value reads as an empty one: a File that is not
 * open, a Frame without bytes, a time of 0. `->` on a temporary does not compile, because it cannot have been tested,
 * and a range-for over a member would outlive it.
 */
template <typename T> class [[nodiscard]] result {
public:
    result(T value) : m_value(std::move(value)), m_has_value(true) {} /**< success */
    result(const flvdmx::error& error) : m_error(error) {}            /**< failure */

    explicit operator bool() const { return m_has_value; } /**< true when there is a value */
    T& operator*() & { return m_value; }                   /**< the value */
    const T& operator*() const& { return m_value; }        /**< the value */
    T operator*() && { return std::move(m_value); }        /**< the value by move, so that a range-for keeps it alive */
    T* operator->() & { return &m_value; }                 /**< member of the value */
    const T* operator->() const& { return &m_value; }      /**< member of the value */
    T* operator->() && = delete;                           /**< see above */
    flvdmx::error error() const { return m_error; }        /**< Kind::none when there is a value */

private:
    T m_value{};
    bool m_has_value = false;
    flvdmx::error m_error;
};

} // namespace flvdmx

#endif /* FLVDMX_RESULT_HPP */
