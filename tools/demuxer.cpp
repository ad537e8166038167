// The entry point behind a class, and the words for what can go wrong.
#include "tools/demuxer.h"

#include <cstdint>
#include <cstring>
#include <filesystem>
#include <fstream>

#include <fmt/core.h>
#include <sys/stat.h>

#include "flvdmx/error_text.h"
#include "flvdmx/next_frame.h"
#include "flvdmx/posix_host.h"
#include "tools/crc32.h"
#include "tools/time_text.h"

namespace tool {

namespace {

bool BeginsWithSignature(const std::string& path)
{
    constexpr char SIGNATURE[] = {'F', 'L', 'V'};
    char bytes[sizeof SIGNATURE] = {};
    std::ifstream(path, std::ios::binary).read(bytes, sizeof bytes);
    return std::memcmp(bytes, SIGNATURE, sizeof SIGNATURE) == 0;
}

// The library says only that there is no sound header; the file itself tells the user more.
std::string HeaderFailureText(const std::string& path)
{
    std::error_code failure;
    const auto size = std::filesystem::file_size(path, failure);
    if (failure)
        return "no FLV file header";
    if (size == 0)
        return "no FLV file header: the file is empty";
    if (BeginsWithSignature(path))
        return fmt::format("the FLV file header is damaged or cut short (the file has {} bytes)", size);
    return "no FLV file header: this is not an FLV file";
}

// A pipe that nobody writes to would not even open.
void RefusePipe(const std::string& path)
{
    struct stat status {};
    if (stat(path.c_str(), &status) != 0 || S_ISREG(status.st_mode) || S_ISBLK(status.st_mode) ||
        S_ISDIR(status.st_mode))
        return;
    throw DemuxError("cannot be opened: a pipe or device cannot be read at any place", FLVD_ERR_OPEN_MAIN);
}

std::string OpenFailureText(const std::string& path, int32_t code)
{
    if (code == FLVD_ERR_OPEN_MAIN || code == FLVD_ERR_OPEN_AUDIO) {
        const int error = flvd_posix_host_open_error();
        return fmt::format("cannot be opened: {}", error != 0 ? std::strerror(error) : "no memory");
    }
    if (code == FLVD_ERR_FILE_HEADER)
        return HeaderFailureText(path);
    return flvd_error_text(code);
}

bool SeeksForward(int64_t target, int64_t current, uint32_t mode)
{
    if ((mode & FLVD_SEEK_RETRY_BACKWARD) != 0)
        return false; // the last attempt
    const uint32_t direction = mode & FLVD_SEEK_DIRECTION_MASK;
    if (direction == FLVD_SEEK_BACKWARD || direction == FLVD_SEEK_FORWARD)
        return direction == FLVD_SEEK_FORWARD;
    return target >= current;
}

} // namespace

std::string DemuxError::Message() const
{
    return m_code == 0 ? std::string(what()) : fmt::format("{} (code {}, line {})", what(), m_code, m_line);
}

Demuxer::Demuxer(const std::string& path, uint32_t options) : m_path(path)
{
    RefusePipe(path);
    flvd_init_t init;
    flvd_posix_host_fill(&init);
    init.file_name = m_path.c_str();
    init.options = options;
    if (QVX_FLV_DMX(FLVD_OP_OPEN, &m_instance, &init, &m_info) != 0)
        throw DemuxError(OpenFailureText(path, g_flvd_lLastError), g_flvd_lLastError, g_flvd_lErrorLine);
}

Demuxer::~Demuxer()
{
    QVX_FLV_DMX(FLVD_OP_CLOSE, &m_instance, nullptr, nullptr);
}

uint32_t Demuxer::Streams() const
{
    return BitsIf(Video() != nullptr, FLVD_STREAM_VIDEO) | BitsIf(Audio() != nullptr, FLVD_STREAM_AUDIO);
}

fio_file_t* Demuxer::Reader(uint32_t stream) const
{
    return stream == FLVD_STREAM_AUDIO ? m_instance->audio_reader : m_instance->main_reader;
}

int64_t Demuxer::Position(uint32_t stream) const
{
    return __FLV_DMX__fioTell64(Reader(stream));
}

void Demuxer::ThrowLastError() const
{
    throw DemuxError(flvd_error_text(m_instance->error), m_instance->error, m_instance->error_line);
}

std::optional<Frame> Demuxer::NextFrame(uint32_t stream)
{
    const flvd_frame_request_t request = {nullptr, 0, stream};
    flvd_frame_t frame{};
    const int32_t result = flvd_next_frame(m_instance, &request, &frame);
    if (result == 0)
        return Describe(frame);
    if (result != FLVD_RET_END)
        ThrowLastError();
    return std::nullopt;
}

Frame Demuxer::Describe(const flvd_frame_t& frame) const
{
    const bool wrapped = frame.timestamp_ms > UINT32_MAX - m_instance->first_ts; // a tag before the first timestamp
    const int64_t time = frame.timestamp_ms - (wrapped ? int64_t{1} << 32 : 0);
    return {frame.stream, time, frame.size, Crc32(frame.data, frame.size)};
}

int64_t Demuxer::CurrentTime() const
{
    return Video() != nullptr ? m_instance->last_video_ts : m_instance->last_audio_ts;
}

void Demuxer::ThrowMiss(int64_t target, uint32_t mode) const
{
    const bool beyondEnd = m_instance->last_ts != 0 && target > m_instance->duration_ms;
    const std::string reason = beyondEnd
                                   ? fmt::format("that is beyond the end at {}", FormatTime(m_instance->duration_ms))
                                   : fmt::format("no keyframe lies at or {} it",
                                                 SeeksForward(target, CurrentTime(), mode) ? "after" : "before");
    throw SeekMiss(fmt::format("seek to {} missed: {}", FormatTime(target), reason), beyondEnd, m_instance->error,
                   m_instance->error_line);
}

int32_t Demuxer::Seek(int32_t time, uint32_t mode)
{
    const int64_t target = (mode & FLVD_SEEK_RELATIVE) != 0 ? CurrentTime() + time : time;
    const flvd_seek_request_t request = {time, mode};
    int32_t reached = 0;
    if (QVX_FLV_DMX(FLVD_OP_SEEK, &m_instance, &request, &reached) >= 0)
        return reached;
    if (m_instance->error == FLVD_ERR_SEEK_MISS)
        ThrowMiss(target, mode);
    ThrowLastError();
}

int64_t BytesBehindLastTag(const flvd_ctx_t& instance)
{
    return instance.data_end < instance.file_size ? instance.file_size - instance.data_end : 0;
}

} // namespace tool
