// An output file, written completely or not at all.
#ifndef FLVDMX_TOOLS_OUTPUT_FILE_H
#define FLVDMX_TOOLS_OUTPUT_FILE_H

#include <cstdint>
#include <cstdio>
#include <string>
#include <string_view>

#include "flvdmx/result.hpp"

namespace tool {

/** A file that is being written, or standard output. Failures are thrown as FileError. An unfinished file is removed,
 *  even after an interruption. */
class OutputFile {
public:
    /**
     * Creates a temporary file, which Finish() renames to `path`; "-" is standard output. An existing file is
     * overwritten only with `force`, and the file `input` never.
     */
    OutputFile(std::string path, const std::string& input, bool force);
    ~OutputFile();
    OutputFile(const OutputFile&) = delete;
    OutputFile& operator=(const OutputFile&) = delete;

    void Write(const void* data, size_t size);
    void Write(std::string_view text) { Write(text.data(), text.size()); }

    /** Replaces the first bytes. Does nothing if the output is a pipe. */
    void Rewrite(flvdmx::Bytes beginning);

    /** Completes the file. Must be called at the end: some errors, such as a full disk, may be reported only then. */
    void Finish();

    uint64_t Written() const { return m_written; } /**< bytes */
    bool IsStandard() const { return m_file == stdout; }
    const std::string& Path() const { return m_path; }

private:
    [[noreturn]] void Fail() const;

    const std::string m_path;
    const std::string m_input;
    std::string m_target;    // the file's own name, if m_path is a symbolic link
    std::string m_temporary; // its name until it is complete
    std::FILE* m_file = nullptr;
    int m_slot = -1; // of that name in the list of unfinished files
    uint64_t m_written = 0;
};

} // namespace tool

#endif
