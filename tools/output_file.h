// A file that is written.
#ifndef FLVDMX_TOOLS_OUTPUT_FILE_H
#define FLVDMX_TOOLS_OUTPUT_FILE_H

#include <cstdio>
#include <memory>
#include <string>
#include <string_view>

namespace tool {

/** A new file; every failure is thrown as DemuxError. */
class OutputFile {
public:
    /** Opens or creates `path` and leaves what is in it; refuses to when that is the file `input`. */
    OutputFile(std::string path, const std::string& input);
    /** Removes a file that was created and not begun. */
    ~OutputFile();
    OutputFile(const OutputFile&) = delete;
    OutputFile& operator=(const OutputFile&) = delete;

    /** Empties the file, which is then to be written. */
    void Begin();

    void Write(const void* data, size_t size);
    void Write(std::string_view text) { Write(text.data(), text.size()); }

    /** Must be called at the end: a full disk may not show earlier. */
    void Close();

private:
    [[noreturn]] void Fail() const;

    struct Closer {
        void operator()(std::FILE* file) const { std::fclose(file); }
    };
    const std::string m_path;
    bool m_created = false; // and not begun
    std::unique_ptr<std::FILE, Closer> m_file;
};

} // namespace tool

#endif
