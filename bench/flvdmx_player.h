/* The library itself as a player, on any host, through its C entry point or through flvdmx.hpp. */
#pragma once

#include "player.h"

#include "flvdmx/flvdmx.h"
#include "flvdmx/flvdmx.hpp"

namespace flvd_bench {

class FlvdmxPlayer : public Player {
public:
    /** host: complete except for the file name; its options apply. */
    explicit FlvdmxPlayer(const flvd_init_t& host) : m_init(host) {}
    ~FlvdmxPlayer() override { close(); }
    FlvdmxPlayer(const FlvdmxPlayer&) = delete;
    FlvdmxPlayer& operator=(const FlvdmxPlayer&) = delete;

    bool open(const std::string& path) override;
    void close() override;
    Tally play() override;
    uint32_t seek(int32_t time_ms) override;

    /** Makes one frame request. @return whether it delivered a frame */
    bool frame(flvd_frame_t& frame);
    /** Seeks without getting a frame. @return whether the seek succeeded */
    bool seek_only(int32_t time_ms, uint32_t mode);
    /** Valid while open. */
    const flvd_ctx_t& instance() const { return *m_instance; }

private:
    flvd_init_t m_init;
    std::string m_path;
    flvd_ctx_t* m_instance = nullptr;
};

/** The library through flvdmx.hpp, with everything that it reports per frame. */
class HeaderPlayer : public Player {
public:
    explicit HeaderPlayer(const flvd_init_t& host) : m_host(host) {}

    bool open(const std::string& path) override;
    void close() override { m_file.close(); }
    Tally play() override;
    uint32_t seek(int32_t time_ms) override;

private:
    flvdmx::Host m_host;
    flvdmx::File m_file;
};

} // namespace flvd_bench
