// A file that is written.
#include "tools/output_file.h"

#include <cerrno>
#include <cstring>
#include <filesystem>
#include <system_error>
#include <utility>

#include <fmt/core.h>

#include "tools/demuxer.h"

namespace tool {

OutputFile::OutputFile(std::string path, const std::string& input) : m_path(std::move(path))
{
    std::error_code failure;
    if (std::filesystem::equivalent(m_path, input, failure))
        throw DemuxError(fmt::format("{} is the file to be read, it is not overwritten", m_path));
    m_file.reset(std::fopen(m_path.c_str(), "wb"));
    if (!m_file)
        Fail();
}

void OutputFile::Write(const void* data, size_t size)
{
    if (std::fwrite(data, 1, size, m_file.get()) != size)
        Fail();
}

void OutputFile::Close()
{
    if (std::fclose(m_file.release()) != 0)
        Fail();
}

void OutputFile::Fail() const
{
    throw DemuxError(fmt::format("cannot write {}: {}", m_path, std::strerror(errno)));
}

} // namespace tool
