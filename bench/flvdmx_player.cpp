#include "flvdmx_player.h"

namespace flvd_bench {

bool FlvdmxPlayer::open(const std::string& path)
{
    close();
    m_path = path; // the library keeps the pointer
    m_init.file_name = m_path.c_str();
    flvd_open_info_t info;
    return QVX_FLV_DMX(FLVD_OP_OPEN, &m_instance, &m_init, &info) == 0;
}

void FlvdmxPlayer::close()
{
    if (m_instance != nullptr)
        QVX_FLV_DMX(FLVD_OP_CLOSE, &m_instance, nullptr, nullptr);
    m_instance = nullptr;
}

Tally FlvdmxPlayer::play()
{
    Tally tally;
    for (flvd_frame_t got; frame(got);)
        tally.add(got.size);
    return tally;
}

uint32_t FlvdmxPlayer::seek(int32_t time_ms)
{
    flvd_frame_t got;
    return seek_only(time_ms, FLVD_SEEK_BACKWARD) && frame(got) ? got.size : 0;
}

bool FlvdmxPlayer::frame(flvd_frame_t& frame)
{
    const flvd_frame_request_t request{};
    return QVX_FLV_DMX(FLVD_OP_GET_FRAME, &m_instance, &request, &frame) == 0;
}

bool FlvdmxPlayer::seek_only(int32_t time_ms, uint32_t mode)
{
    const flvd_seek_request_t request{time_ms, mode};
    int32_t reached = 0;
    return QVX_FLV_DMX(FLVD_OP_SEEK, &m_instance, &request, &reached) == 0;
}

bool HeaderPlayer::open(const std::string& path)
{
    m_file = *flvdmx::File::open(path, m_host);
    return m_file.is_open();
}

Tally HeaderPlayer::play()
{
    Tally tally;
    for (const flvdmx::Frame& frame : m_file.frames())
        tally.add(static_cast<uint32_t>(frame.data.size()));
    return tally;
}

uint32_t HeaderPlayer::seek(int32_t time_ms)
{
    const bool reached = static_cast<bool>(m_file.seek(flvdmx::Milliseconds(time_ms), flvdmx::SeekMode::backward));
    return reached ? static_cast<uint32_t>((*m_file.next_frame()).data.size()) : 0;
}

} // namespace flvd_bench
