// A file to write.
#include "tools/output_file.h"

#include <array>
#include <atomic>
#include <cerrno>
#include <csignal>
#include <cstring>
#include <filesystem>
#include <system_error>
#include <utility>

#include <fcntl.h>
#include <fmt/core.h>
#include <sys/stat.h>
#include <unistd.h>

#include "tools/input.h"
#include "tools/report.h"

namespace tool {

namespace {

constexpr mode_t NEW_FILE_MODE = 0666; // before the umask
constexpr mode_t PERMISSIONS = 0777;

// Names of unfinished files: at most one per stream.
std::array<std::atomic<const char*>, 2> g_unfinished{};

void RemoveUnfinished(int signal)
{
    for (const std::atomic<const char*>& path : g_unfinished)
        if (const char* const name = path; name != nullptr)
            unlink(name);
    std::signal(signal, SIG_DFL);
    raise(signal);
}

int Remember(const char* path)
{
    for (const int signal : {SIGINT, SIGTERM, SIGHUP})
        if (std::signal(signal, RemoveUnfinished) == SIG_IGN)
            std::signal(signal, SIG_IGN); // keep ignoring it under `nohup`
    for (size_t slot = 0; slot < g_unfinished.size(); ++slot) {
        const char* none = nullptr;
        if (g_unfinished[slot].compare_exchange_strong(none, path))
            return static_cast<int>(slot);
    }
    return -1;
}

void Forget(int slot)
{
    if (slot >= 0)
        g_unfinished[static_cast<size_t>(slot)] = nullptr;
}

bool IsSpecial(const std::string& path)
{
    struct stat status {};
    return stat(path.c_str(), &status) == 0 && !S_ISREG(status.st_mode);
}

// The file that a symbolic link leads to, so that the link stays when the file is replaced.
std::string Target(const std::string& path)
{
    std::error_code failure;
    const std::filesystem::path target = std::filesystem::canonical(path, failure);
    return failure ? path : target.string();
}

// Those of the file that exists, or of a new one.
mode_t PermissionsOf(const std::string& path)
{
    struct stat status {};
    if (stat(path.c_str(), &status) == 0)
        return status.st_mode & PERMISSIONS;
    const mode_t mask = umask(0);
    umask(mask);
    return NEW_FILE_MODE & ~mask;
}

// Creates a file with a unique name by replacing the last six characters of `path`. Null on failure.
std::FILE* CreateTemporary(std::string& path, mode_t permissions)
{
    const int descriptor = mkostemp(path.data(), O_CLOEXEC);
    if (descriptor < 0)
        return nullptr;
    fchmod(descriptor, permissions);
    return fdopen(descriptor, "wb");
}

} // namespace

OutputFile::OutputFile(std::string path, const std::string& input, bool force) : m_path(std::move(path)), m_input(input)
{
    if (m_path == STANDARD_STREAM) {
        m_file = stdout;
        return;
    }
    std::error_code failure;
    if (std::filesystem::equivalent(m_path, PathOf(input), failure))
        throw FileError(input, fmt::format("{} is the input file: it is not overwritten", Printable(m_path)));
    if (IsSpecial(m_path)) {
        m_file = std::fopen(m_path.c_str(), "wb");
    } else {
        if (!force && std::filesystem::exists(m_path, failure))
            throw FileError(input, fmt::format("{} exists: use --force to overwrite it", Printable(m_path)));
        m_target = Target(m_path);
        m_temporary = m_target + ".XXXXXX";
        m_slot = Remember(m_temporary.c_str()); // before the file exists: a signal may arrive at once
        m_file = CreateTemporary(m_temporary, PermissionsOf(m_target));
    }
    if (m_file == nullptr) {
        Forget(m_slot);
        Fail();
    }
}

OutputFile::~OutputFile()
{
    if (m_file != nullptr && !IsStandard())
        std::fclose(m_file);
    if (m_slot >= 0)
        unlink(m_temporary.c_str());
    Forget(m_slot);
}

void OutputFile::Write(const void* data, size_t size)
{
    if (size > 0 && std::fwrite(data, 1, size, m_file) != size)
        Fail();
    m_written += size;
}

void OutputFile::Rewrite(flvdmx::Bytes beginning)
{
    if (std::fflush(m_file) != 0) // fseek would report this failure as "not seekable"
        Fail();
    if (std::fseek(m_file, 0, SEEK_SET) == 0 &&
        std::fwrite(beginning.data(), 1, beginning.size(), m_file) != beginning.size())
        Fail();
}

void OutputFile::Finish()
{
    if (IsStandard())
        return Flush();
    if (std::fclose(std::exchange(m_file, nullptr)) != 0)
        Fail();
    if (!m_temporary.empty() && std::rename(m_temporary.c_str(), m_target.c_str()) != 0)
        Fail();
    Forget(std::exchange(m_slot, -1));
}

void OutputFile::Fail() const
{
    if (IsStandard())
        throw std::system_error(errno, std::generic_category());
    throw FileError(m_input, fmt::format("cannot write {}: {}", Printable(m_path), std::strerror(errno)));
}

} // namespace tool
