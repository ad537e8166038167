#include "session.h"

#include <algorithm>
#include <cstring>

namespace flvd_test {

const std::vector<FailureSite>& FailureSites()
{
    constexpr Op CALL = Op::Call, OPEN = Op::Open, CODEC = Op::Codec, EXTENT = Op::Extent, TAG = Op::Tag;
    constexpr Op FRAME = Op::Frame, TIME_SEEK = Op::Seek, FRAME_SEEK = Op::FrameSeek;
#define FLVD_SITE(operation, name, code, line, growing_line) {#name, operation, code, line, growing_line},
    static const std::vector<FailureSite> sites = {
#include "flvdmx/common/sites.def"
    };
#undef FLVD_SITE
    return sites;
}

int32_t FailureSite::result() const
{
    switch (op == Op::FrameSeek ? FLVD_ERR_NONE : code) { // a frame seek is not an operation of the entry point
    case FLVD_ERR_NO_INSTANCE:
        return FLVD_RET_NO_INSTANCE;
    case FLVD_ERR_OPEN_MAIN:
    case FLVD_ERR_OPEN_AUDIO:
        return FLVD_RET_CANNOT_OPEN;
    case FLVD_ERR_SHORT_DATA:
    case FLVD_ERR_SEEK_MISS:
        return FLVD_RET_END;
    default:
        return FLVD_RET_FAILED;
    }
}

bool IsListed(Op op, int32_t rc, int32_t code, int32_t line)
{
    return std::any_of(FailureSites().begin(), FailureSites().end(), [&](const FailureSite& site) {
        return site.op == op && site.result() == rc && site.records(code, line);
    });
}

Session::Session(FakeHost& host, const OpenOptions& options) : m_options(options.options)
{
    const flvd_init_t init = host.init(options.options, options.cache_size, options.scan_read_size, options.path);
    if ((options.options & FLVD_OPT_USER_BUFFER) != 0)
        m_user_buffer.resize(options.user_buffer_size);
    m_open_rc = QVX_FLV_DMX(options.for_info ? FLVD_OP_OPEN_INFO : FLVD_OP_OPEN, &m_ctx, &init, &m_info);
}

Session::~Session()
{
    if (m_ctx != nullptr)
        close();
}

FrameResult Session::frame(uint32_t stream)
{
    uint8_t* const buffer = m_user_buffer.empty() ? nullptr : m_user_buffer.data();
    const flvd_frame_request_t request{buffer, static_cast<uint32_t>(m_user_buffer.size()), stream};
    std::memset(&m_record, POISON, sizeof m_record);
    const int32_t rc = QVX_FLV_DMX(FLVD_OP_GET_FRAME, &m_ctx, &request, &m_record);
    const auto& [data, size, stream_of, timestamp, reserved] = m_record;
    return {rc, {stream_of, timestamp, rc == 0 ? Bytes(data, data + size) : Bytes{}}};
}

int32_t Session::seek(int32_t time, uint32_t mode, int32_t* reached)
{
    const flvd_seek_request_t request{time, mode};
    int32_t ignored = 0;
    return QVX_FLV_DMX(FLVD_OP_SEEK, &m_ctx, &request, reached != nullptr ? reached : &ignored);
}

int32_t Session::frame_seek(uint32_t time, uint32_t stream, uint32_t mode, uint32_t* reached)
{
    const auto run = (m_options & GROWING) != 0 ? FLVD_RunFrameSeekProgressive : FLVD_RunFrameSeek;
    return run(m_ctx, time, reached, stream, mode == BACK ? 1 : 0);
}

int32_t Session::close()
{
    const int32_t rc = QVX_FLV_DMX(FLVD_OP_CLOSE, &m_ctx, nullptr, nullptr);
    m_ctx = nullptr;
    return rc;
}

Frames play(Session& session, uint32_t stream, int32_t* rc)
{
    Frames frames;
    FrameResult result = session.frame(stream);
    for (; result.rc == 0; result = session.frame(stream))
        frames.push_back(std::move(result.frame));
    if (rc != nullptr)
        *rc = result.rc;
    return frames;
}

} // namespace flvd_test
