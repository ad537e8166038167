// What all commands print.
#include "tools/report.h"

#include <cerrno>
#include <cstdio>
#include <system_error>

#include <fmt/core.h>

#include "tools/text.h"

namespace tool {

namespace {

bool g_showsCodes = false;

} // namespace

void ShowCodes()
{
    g_showsCodes = true;
}

Json FileError::Object() const
{
    return {{"message", what()}, {"code", m_error.code()}, {"line", m_error.line()}};
}

void Print(std::string_view text)
{
    if (std::fwrite(text.data(), 1, text.size(), stdout) != text.size())
        throw std::system_error(errno, std::generic_category());
}

void Flush()
{
    if (std::fflush(stdout) != 0)
        throw std::system_error(errno, std::generic_category());
}

void PrintJson(const Json& document, int indent)
{
    // A file name may be invalid UTF-8; a JSON document must not.
    Print(document.dump(indent, ' ', false, Json::error_handler_t::replace) + "\n");
}

void Tell(const std::string& text)
{
    std::fputs(text.c_str(), stderr);
}

std::string DisplayName(const std::string& file)
{
    return file == STANDARD_STREAM ? "standard input" : Printable(file);
}

void Complain(const std::string& file, std::string_view text)
{
    std::fflush(stdout); // keeps the order of output and messages on a terminal
    Tell(fmt::format("flvdmx: {}: {}\n", DisplayName(file), text));
}

void Complain(const FileError& error)
{
    const flvdmx::error& cause = error.Cause();
    const bool coded = g_showsCodes && cause.kind() != flvdmx::Kind::none;
    Complain(error.File(),
             error.what() + (coded ? fmt::format(" (code {}, line {})", cause.code(), cause.line()) : ""));
}

const char* StreamName(flvdmx::Stream stream)
{
    return stream == flvdmx::Stream::video ? "video" : "audio";
}

} // namespace tool
