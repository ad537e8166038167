// One open file: the library's entry point with the POSIX host, results as exceptions with words for the user.
#ifndef FLVDMX_TOOLS_DEMUXER_H
#define FLVDMX_TOOLS_DEMUXER_H

#include <cstdint>
#include <optional>
#include <stdexcept>
#include <string>

#include "flvdmx/flvdmx.h"

namespace tool {

/** @return `bits` when `set`, else none */
constexpr uint32_t BitsIf(bool set, uint32_t bits)
{
    return set ? bits : 0;
}

/** A file that could not be demuxed. what() says why in words, without the file's name. */
class DemuxError : public std::runtime_error {
public:
    explicit DemuxError(const std::string& text, int32_t code = 0, int32_t line = 0)
        : std::runtime_error(text), m_code(code), m_line(line)
    {
    }
    int32_t Code() const { return m_code; } /**< the library's code; 0: the library was not asked */
    int32_t Line() const { return m_line; } /**< the library's number of the place of failure */
    /** @return the words, with the library's code and line behind them */
    std::string Message() const;

private:
    int32_t m_code;
    int32_t m_line;
};

/** A seek that found nothing to land on. */
class SeekMiss : public DemuxError {
public:
    SeekMiss(const std::string& text, bool beyondEnd, int32_t code, int32_t line)
        : DemuxError(text, code, line), m_beyondEnd(beyondEnd)
    {
    }
    bool BeyondEnd() const { return m_beyondEnd; } /**< else there is no keyframe in that direction */

private:
    bool m_beyondEnd;
};

/** What is reported of a frame. */
struct Frame {
    uint32_t stream; /**< FLVD_STREAM_VIDEO or FLVD_STREAM_AUDIO */
    int64_t timeMs;  /**< from the first timestamp; negative when the tag lies before it */
    uint32_t size;   /**< bytes */
    uint32_t crc;    /**< CRC-32 of the payload */
};

/** An open instance; everything is released at the end of its life. Errors are thrown as DemuxError. */
class Demuxer {
public:
    /** Opens `path` with FLVD_OPT_* bits. */
    Demuxer(const std::string& path, uint32_t options);
    ~Demuxer();
    Demuxer(const Demuxer&) = delete;
    Demuxer& operator=(const Demuxer&) = delete;

    const std::string& Path() const { return m_path; }
    flvd_ctx_t* Instance() const { return m_instance; }
    const flvd_video_info_t* Video() const { return m_info.video_info; } /**< null without video */
    const flvd_audio_info_t* Audio() const { return m_info.audio_info; } /**< null without audio */
    uint32_t Streams() const;                                            /**< FLVD_STREAM_* bits of the streams found */
    bool HasSeparateAudio() const { return (m_instance->options & FLVD_OPT_SEPARATE_AUDIO_READER) != 0; }

    /**
     * @param stream with a separate audio reader FLVD_STREAM_VIDEO or _AUDIO, else not looked at
     * @return the next frame; nothing at the end of the data, which a growing file may leave behind later
     */
    std::optional<Frame> NextFrame(uint32_t stream);

    /**
     * Seeks; `time` and `mode` as in flvd_seek_request_t. Throws SeekMiss when there is nothing to land on.
     * @return the time reached in ms
     */
    int32_t Seek(int32_t time, uint32_t mode);

    /**
     * From now on a tag may have any time, as in a file that is growing. Without it a complete file gives no tag that
     * is later than its last ones, as most tags of a file may be to which the beginning of another was appended. Not to
     * be followed by a seek.
     */
    void AcceptAllTimes() { m_instance->last_ts = 0; }

    /** @return the reader that serves `stream`, borrowed */
    fio_file_t* Reader(uint32_t stream) const;

    /** @return byte position of that reader */
    int64_t Position(uint32_t stream) const;

private:
    [[noreturn]] void ThrowLastError() const;
    [[noreturn]] void ThrowMiss(int64_t target, uint32_t mode) const;
    int64_t CurrentTime() const;
    Frame Describe(const flvd_frame_t& frame) const;

    const std::string m_path;
    flvd_ctx_t* m_instance = nullptr;
    flvd_open_info_t m_info{};
};

/** @return bytes behind the last whole tag of a complete file */
int64_t BytesBehindLastTag(const flvd_ctx_t& instance);

} // namespace tool

#endif
