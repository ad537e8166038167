// A file that is written.
#include "tools/output_file.h"

#include <cerrno>
#include <cstring>
#include <filesystem>
#include <system_error>
#include <utility>

#include <fcntl.h>
#include <fmt/core.h>
#include <sys/stat.h>
#include <unistd.h>

#include "tools/demuxer.h"

namespace tool {

namespace {

constexpr mode_t NEW_FILE_MODE = 0666; // less what the process masks

} // namespace

OutputFile::OutputFile(std::string path, const std::string& input) : m_path(std::move(path))
{
    std::error_code failure;
    if (std::filesystem::equivalent(m_path, input, failure))
        throw DemuxError(fmt::format("{} is the file to be read, it is not overwritten", m_path));
    constexpr int FLAGS = O_WRONLY | O_CREAT | O_CLOEXEC;
    int descriptor = open(m_path.c_str(), FLAGS | O_EXCL, NEW_FILE_MODE);
    m_created = descriptor >= 0;
    if (!m_created && errno == EEXIST)
        descriptor = open(m_path.c_str(), FLAGS, NEW_FILE_MODE);
    if (descriptor < 0)
        Fail();
    m_file.reset(fdopen(descriptor, "wb"));
}

OutputFile::~OutputFile()
{
    if (m_created)
        unlink(m_path.c_str());
}

void OutputFile::Begin()
{
    m_created = false;
    struct stat status {};
    const int descriptor = fileno(m_file.get());
    if (fstat(descriptor, &status) == 0 && S_ISREG(status.st_mode) && ftruncate(descriptor, 0) != 0)
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
