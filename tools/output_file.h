// A file that is written, whole or not at all.
#ifndef FLVDMX_TOOLS_OUTPUT_FILE_H
#define FLVDMX_TOOLS_OUTPUT_FILE_H

#include <cstdint>
#include <cstdio>
#include <string>
#include <string_view>

#include "flvdmx/result.hpp"

namespace tool {

/** A file on its way, or standard output; every failure is thrown as FileError. One that is not finished is removed,
 * also when the user interrupts the program. */
class OutputFile {
public:
    /**
     * Creates a file that Finish() gives the name `path`; "-" is standard output. A file that exists is refused without
     * `force`, the file `input` always.
     */
    OutputFile(std::string path, const std::string& input, bool force);
    ~OutputFile();
    OutputFile(const OutputFile&) = delete;
    OutputFile& operator=(const OutputFile&) = delete;

    void Write(const void* data, size_t size);
    void Write(std::string_view text) { Write(text.data(), text.size()); }

    /** Replaces the first bytes where that is possible, which it is not in a pipe. */
    void Rewrite(flvdmx::Bytes beginning);

    /** Keeps the file. Must be called at the end: a full disk may not show earlier. */
    void Finish();

    uint64_t Written() const { return m_written; } /**< bytes */
    bool IsStandard() const { return m_file == stdout; }
    const std::string& Path() const { return m_path; }

private:
    [[noreturn]] void Fail() const;

    const std::string m_path;
    const std::string m_input;
    std::string m_temporary; // the name until it is finished
    std::FILE* m_file = nullptr;
    int m_slot = -1; // of its name in the list of what is removed
    uint64_t m_written = 0;
};

} // namespace tool

#endif
