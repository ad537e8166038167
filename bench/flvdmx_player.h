/* The library itself as a player, on any host, through its C entry point or through flvdmx.hpp. */
#pragma once

#include "player.h"

#include "flvdmx/flvdmx.h"
#include "flvdmx/flvdmx.hpp"

namespace flvd_bench {

class FlvdmxPlayer : public Player {
public:
    /** host: filled but for the file name; its options count. */
    explicit FlvdmxPlayer(const flvd_init_t& host) : m_init(host) {}
    ~FlvdmxPlayer() override { close(); }
    FlvdmxPlayer(const FlvdmxPlayer&) = delete;
    FlvdmxPlayer& operator=(const FlvdmxPlayer&) = delete;

    bool open(const std::string& path) override;
    void close() override;
    Tally play() override;
    uint32_t seek(int32_t time_ms) override;

    /** One request. @return whether it brought a frame */
    bool frame(flvd_frame_t& frame);
    /** A seek alone. @return whether it reached a time */
    bool seek_only(int32_t time_ms, uint32_t mode);
    /** Valid while open. */
    const flvd_ctx_t& instance() const { return *m_instance; }

private:
    flvd_init_t m_init;
    std::string m_path;
    flvd_ctx_t* m_instance = nullptr;
};

/** Through flvdmx.hpp: with all that it tells of a frame. */
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
