/*
 * What the functions of flvdmx.hpp return: a value or the error that took its place. Usable from C++17.
 */
#ifndef FLVDMX_RESULT_HPP
#define FLVDMX_RESULT_HPP

#include "flvdmx/error_text.h"

#include <cstddef>
#include <cstdint>
#include <utility>
#include <vector>

namespace flvdmx {

/** Borrowed bytes. */
class Bytes {
public:
    constexpr Bytes() = default;
    /** Borrows `size` bytes from `data` on. */
    constexpr Bytes(const uint8_t* data, size_t size) : m_data(data), m_size(size) {}
    /** Borrows all bytes of a vector, such as VideoInfo::config. */
    Bytes(const std::vector<uint8_t>& bytes) : m_data(bytes.data()), m_size(bytes.size()) {} // NOLINT: a view, as meant
    constexpr const uint8_t* data() const { return m_data; }         /**< the first; null when there is none */
    constexpr size_t size() const { return m_size; }                 /**< their number */
    constexpr bool empty() const { return m_size == 0; }             /**< true without bytes */
    constexpr const uint8_t* begin() const { return m_data; }        /**< the first */
    constexpr const uint8_t* end() const { return m_data + m_size; } /**< after the last */
    /** Byte `i`; 0 when there are not so many. */
    constexpr uint8_t operator[](size_t i) const { return i < m_size ? m_data[i] : uint8_t{0}; }

private:
    const uint8_t* m_data = nullptr;
    size_t m_size = 0;
};

/** What a failure means for the caller. */
enum class Kind {
    none,    /**< no failure */
    end,     /**< the end of the data */
    not_yet, /**< a growing file holds no more so far: retry, or open it again, later */
    miss,    /**< a seek found nothing to land on; playing continues where it was, or at the end if asked for */
    failed   /**< anything else */
};

/** A failure: code and line, what they mean, and why the system did not open a file. */
class error {
public:
    constexpr error() = default;
    /** From the library's code and line, and the system's reason. */
    constexpr error(Kind kind, int32_t code, int32_t line, int system_error = 0)
        : m_kind(kind), m_code(code), m_line(line), m_system_error(system_error)
    {
    }

    constexpr Kind kind() const { return m_kind; }    /**< what it means for the caller */
    constexpr int32_t code() const { return m_code; } /**< FLVD_ERR_* of flvdmx.h or error_text.h */
    constexpr int32_t line() const
    {
        return m_line;
    } /**< number of the place of failure, the same in every release;
           0: not in the library */
    /** errno of the host when it could not open the file (ENOENT, EACCES, ...), for strerror; else 0. */
    constexpr int system_error() const { return m_system_error; }
    const char* name() const { return flvd_error_name(m_code); } /**< such as "FLVD_ERR_SEEK" */
    const char* text() const { return flvd_error_text(m_code); } /**< what happened, for people */

private:
    Kind m_kind = Kind::none;
    int32_t m_code = FLVD_ERR_NONE;
    int32_t m_line = 0;
    int m_system_error = 0;
};

/**
 * A value, or the error that took its place: test first. A value that is not there reads as an empty one: a File that
 * is not open, a Frame without bytes, a time of 0. Of a temporary, `->` is refused: nobody can have tested it, and a
 * range-for over what it leads to would outlive it.
 */
template <typename T> class [[nodiscard]] result {
public:
    result(T value) : m_value(std::move(value)), m_has_value(true) {} /**< success */
    result(const flvdmx::error& error) : m_error(error) {}            /**< failure */

    explicit operator bool() const { return m_has_value; } /**< true when there is a value */
    T& operator*() & { return m_value; }                   /**< the value */
    const T& operator*() const& { return m_value; }        /**< the value */
    T operator*() && { return std::move(m_value); }        /**< the value, which a range-for keeps alive */
    T* operator->() & { return &m_value; }                 /**< of the value */
    const T* operator->() const& { return &m_value; }      /**< of the value */
    T* operator->() && = delete;                           /**< refused */
    flvdmx::error error() const { return m_error; }        /**< of Kind::none when there is a value */

private:
    T m_value{};
    bool m_has_value = false;
    flvdmx::error m_error;
};

} // namespace flvdmx

#endif /* FLVDMX_RESULT_HPP */
