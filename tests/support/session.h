/* A file opened through the entry point, closed again at the end. */
#pragma once

#include "fake_host.h"

namespace flvd_test {

struct OpenOptions {
    uint32_t options = 0; /**< FLVD_OPT_* */
    bool for_info = false;
    uint32_t cache_size = 0;
    uint32_t scan_read_size = 0;
    const char* path = FakeHost::DEFAULT_FILE;
    uint32_t user_buffer_size = 1u << 20; /**< with FLVD_OPT_USER_BUFFER: what each request offers */
};

struct FrameResult {
    int32_t rc = 0;
    Frame frame; /**< copied; as far as delivered */
};

class Session {
public:
    /** Opens; see opened() and open_rc(). The host must live as long as the session. */
    explicit Session(FakeHost& host, const OpenOptions& options = {});
    ~Session();
    Session(const Session&) = delete;
    Session& operator=(const Session&) = delete;

    bool opened() const { return m_open_rc == 0; }
    int32_t open_rc() const { return m_open_rc; }
    const flvd_open_info_t& info() const { return m_info; }
    /** Null after a failed open and after close(). */
    const flvd_ctx_t* ctx() const { return m_ctx; }
    flvd_ctx_t* ctx() { return m_ctx; }

    /** stream: looked at with FLVD_OPT_SEPARATE_AUDIO_READER only. */
    FrameResult frame(uint32_t stream = 0);
    int32_t seek(int32_t time, uint32_t mode, int32_t* reached = nullptr);
    int32_t last_error();
    /** Line of the last failure: the instance's, or the global one after a failed open. */
    int32_t error_line() const { return m_ctx != nullptr ? m_ctx->error_line : g_flvd_lErrorLine; }
    /** Also done at the end. */
    int32_t close();

private:
    flvd_ctx_t* m_ctx = nullptr;
    flvd_open_info_t m_info{};
    Bytes m_user_buffer;
    int32_t m_open_rc = 0;
};

/** All frames from here to the first request that fails; `rc` receives that result. */
Frames play(Session& session, uint32_t stream = 0, int32_t* rc = nullptr);

} // namespace flvd_test
