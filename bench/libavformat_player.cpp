#include "player.h"

#ifdef FLVDMX_BENCH_LIBAVFORMAT

extern "C" {
#include <libavformat/avformat.h>
}

namespace flvd_bench {
namespace {

constexpr int64_t LEAST_PROBE = 32, LEAST_ANALYSIS = 1; // bytes, microseconds

class LibavformatPlayer : public Player {
public:
    explicit LibavformatPlayer(LibavformatOpen how) : m_packet(av_packet_alloc()), m_how(how)
    {
        av_log_set_level(AV_LOG_QUIET);
    }
    ~LibavformatPlayer() override
    {
        avformat_close_input(&m_context);
        av_packet_free(&m_packet);
    }
    LibavformatPlayer(const LibavformatPlayer&) = delete;
    LibavformatPlayer& operator=(const LibavformatPlayer&) = delete;

    bool open(const std::string& path) override
    {
        close();
        m_context = avformat_alloc_context();
        m_context->flags |= AVFMT_FLAG_NOPARSE | AVFMT_FLAG_NOFILLIN;
        m_context->probesize = LEAST_PROBE;
        m_context->max_analyze_duration = LEAST_ANALYSIS;
        static const AVInputFormat* const format = av_find_input_format("flv"); // explicit, so that it does not probe
        return avformat_open_input(&m_context, path.c_str(), format, nullptr) == 0 && learn();
    }
    void close() override { avformat_close_input(&m_context); }

    Tally play() override
    {
        Tally tally;
        for (; av_read_frame(m_context, m_packet) == 0; av_packet_unref(m_packet))
            tally.add(static_cast<uint32_t>(m_packet->size));
        return tally;
    }

    uint32_t seek(int32_t time_ms) override
    {
        const int stream = video();
        if (av_seek_frame(m_context, stream, time_ms, AVSEEK_FLAG_BACKWARD) < 0)
            return 0;
        int size = 0;
        while (size == 0 && av_read_frame(m_context, m_packet) == 0) { // audio may come before the video frame
            size = m_packet->stream_index == stream ? m_packet->size : 0;
            av_packet_unref(m_packet);
        }
        return static_cast<uint32_t>(size);
    }

private:
    bool learn()
    {
        if (m_how == LibavformatOpen::StreamInfo)
            return avformat_find_stream_info(m_context, nullptr) >= 0;
        while (m_how == LibavformatOpen::StreamsKnown && video() < 0) {
            if (av_read_frame(m_context, m_packet) < 0)
                return false;
            av_packet_unref(m_packet);
        }
        return true;
    }

    int video() const
    {
        for (unsigned i = 0; i < m_context->nb_streams; ++i)
            if (m_context->streams[i]->codecpar->codec_type == AVMEDIA_TYPE_VIDEO)
                return static_cast<int>(i);
        return -1;
    }

    AVFormatContext* m_context = nullptr;
    AVPacket* m_packet;
    LibavformatOpen m_how;
};

} // namespace

PlayerPtr MakeLibavformatPlayer(LibavformatOpen how)
{
    return std::make_unique<LibavformatPlayer>(how);
}

} // namespace flvd_bench

#else

namespace flvd_bench {

PlayerPtr MakeLibavformatPlayer(LibavformatOpen)
{
    return nullptr;
}

} // namespace flvd_bench

#endif
