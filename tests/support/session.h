/* A file opened through the entry point, closed again at the end. */
#pragma once

#include "fake_host.h"

#include <optional>

namespace flvd_test {

constexpr uint32_t SEPARATE = FLVD_OPT_SEPARATE_AUDIO_READER, USER = FLVD_OPT_USER_BUFFER;
constexpr uint32_t GROWING = FLVD_OPT_PROGRESSIVE, INDEX = FLVD_OPT_INDEX_IN_MEMORY;
constexpr uint32_t BACK = FLVD_SEEK_BACKWARD, FORTH = FLVD_SEEK_FORWARD, REL = FLVD_SEEK_RELATIVE;
constexpr uint32_t RETRY = FLVD_SEEK_RETRY_BACKWARD, AT_END = FLVD_SEEK_TO_END_ON_MISS;
constexpr uint32_t VIDEO = FLVD_STREAM_VIDEO, AUDIO = FLVD_STREAM_AUDIO, BOTH = VIDEO | AUDIO;

constexpr uint32_t SMALL = 1024;               // a cache that LARGE tags do not fit, so that they cost extra host calls
constexpr size_t LARGE = 3000, GROWN = 600000; // bytes; GROWN is above the first frame buffer

/** The streams to request in turn from a file that is opened with these options. */
inline std::vector<uint32_t> Streams(uint32_t options)
{
    return (options & SEPARATE) != 0 ? std::vector{VIDEO, AUDIO} : std::vector{BOTH};
}

/**
 * The operation that fails: a call without an instance, an open, a frame request, a time seek, a frame seek. An open
 * also records why a tag does not describe its stream and why it finds no end, and a request why it does not deliver a
 * tag.
 */
enum class Op { Call, Open, Codec, Extent, Tag, Frame, Seek, FrameSeek };

/** The failure sites, named as in the library's table. */
enum class Site : uint8_t {
#define FLVD_SITE(operation, name, code, line, growing_line) name,
#include "flvdmx/common/sites.def"
#undef FLVD_SITE
};
struct FailureSite {
    std::string name;
    Op op;
    int32_t code, line, growing_line; /**< error code; lines; growing_line is 0 if it is the same in a growing file */

    bool records(int32_t error, int32_t error_line) const
    {
        return code == error && error_line != 0 && (line == error_line || growing_line == error_line);
    }
    int32_t line_of(uint32_t options) const
    {
        return (options & GROWING) != 0 && growing_line != 0 ? growing_line : line;
    }
    /** The result of an operation that fails here. */
    int32_t result() const;
};
/** All failure sites, in the order of the enumeration. */
const std::vector<FailureSite>& FailureSites();
inline const auto At = [](Site site) -> const FailureSite& { return FailureSites().at(static_cast<size_t>(site)); };
bool IsListed(Op op, int32_t rc, int32_t code, int32_t line);

struct OpenOptions {
    uint32_t options = 0; /**< FLVD_OPT_* */
    bool for_info = false;
    uint32_t cache_size = 0;
    uint32_t scan_read_size = 0;
    const char* path = FakeHost::DEFAULT_FILE;
    uint32_t user_buffer_size = 8192; /**< with FLVD_OPT_USER_BUFFER: size of the buffer for each request */
};

struct FrameResult {
    int32_t rc = 0;
    Frame frame; /**< a copy of what was delivered */
};

class Session {
public:
    static constexpr uint8_t POISON = 0x5A;

    /** Opens; see opened() and open_rc(). The host must outlive the session. */
    explicit Session(FakeHost& host, const OpenOptions& options = {});
    ~Session();
    Session(const Session&) = delete;
    Session& operator=(const Session&) = delete;

    bool opened() const { return m_open_rc == 0; }
    int32_t open_rc() const { return m_open_rc; }
    const flvd_open_info_t& info() const { return m_info; }
    /** Null after a failed open and after close(). */
    flvd_ctx_t* ctx() const { return m_ctx; }

    /** stream: ignored without FLVD_OPT_SEPARATE_AUDIO_READER. */
    FrameResult frame(uint32_t stream = 0);
    /** The record of the last request, which was filled with POISON before, and the buffer for that request. */
    const flvd_frame_t& record() const { return m_record; }
    const Bytes& user_buffer() const { return m_user_buffer; }
    int32_t seek(int32_t time, uint32_t mode, int32_t* reached = nullptr);
    /** A frame seek of one stream; mode: BACK or not. */
    int32_t frame_seek(uint32_t time, uint32_t stream, uint32_t mode, uint32_t* reached);
    int32_t last_error() { return QVX_FLV_DMX(FLVD_OP_GET_LAST_ERROR, &m_ctx, nullptr, nullptr); }
    /** Line of the last failure: the instance's, or the global one after a failed open. */
    int32_t error_line() const { return m_ctx != nullptr ? m_ctx->error_line : g_flvd_lErrorLine; }
    /** True if the last failure was at the site; nullopt: if there was none. */
    bool recorded(std::optional<Site> site)
    {
        return last_error() == (site ? At(*site).code : 0) && error_line() == (site ? At(*site).line_of(m_options) : 0);
    }
    /** True if such an operation may have the last failure. */
    bool failed_as_listed(Op op, int32_t rc) { return IsListed(op, rc, last_error(), error_line()); }
    /** Also called by the destructor. */
    int32_t close();

private:
    flvd_ctx_t* m_ctx = nullptr;
    flvd_open_info_t m_info{};
    flvd_frame_t m_record{};
    Bytes m_user_buffer;
    const uint32_t m_options;
    int32_t m_open_rc = 0;
};

/** All frames from here to the first request that fails; `rc` receives that result. */
Frames play(Session& session, uint32_t stream = 0, int32_t* rc = nullptr);

} // namespace flvd_test
