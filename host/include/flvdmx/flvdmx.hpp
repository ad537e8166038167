/*
 * flvdmx for C++17: one open file as an object over the C interface of flvdmx.h. Header only; link flvdmx-host.
 *
 *     auto file = flvdmx::File::open("clip.flv");
 *     if (!file)
 *         return std::fprintf(stderr, "%s\n", file.error().text());
 *     for (const flvdmx::Frame& frame : file->frames())
 *         play(frame.stream, frame.time, frame.data);
 *
 * Nothing here throws, and nothing needs exceptions or run-time type information: what can fail returns a result<T>.
 *
 * THE PROCESS-WIDE TABLES
 *
 * The library calls the memory and file functions of its host. They carry no context, so there is one set of them for
 * the process: every open overwrites it, and all files that are open already go on with the newest functions. Hence:
 *
 * - Give every open the same functions. File::open(path) takes those of the stdio host; the other hosts of the kit, and
 *   hosts of your own, are passed as a Host. Files opened through different hosts must not be open at the same time.
 * - Opening and closing hold open_mutex, so threads may open files, look at their Info and let them go as they like.
 *   All other calls take no lock, and an open must not run beside them, on whatever File: when threads play files while
 *   others open some, they hold open_mutex around their own calls as well.
 * - One File is used by one thread at a time. Calls on different Files may run at the same time.
 */
#ifndef FLVDMX_FLVDMX_HPP
#define FLVDMX_FLVDMX_HPP

#include "flvdmx/error_text.h"
#include "flvdmx/flvdmx.h"
#include "flvdmx/next_frame.h"
#include "flvdmx/stdio_host.h"

#include <chrono>
#include <cstddef>
#include <cstring>
#include <limits>
#include <memory>
#include <mutex>
#include <new>
#include <optional>
#include <string_view>
#include <utility>

namespace flvdmx {

/**
 * Held while a file is opened, for the process-wide tables and the globals in which a failed open leaves its error, and
 * while one is closed, which uses the tables. Whoever holds it may open and close.
 */
inline std::recursive_mutex open_mutex;

/** Every time and duration. */
using Milliseconds = std::chrono::milliseconds;

/** The host's functions. */
class Host {
public:
    /** From a block of which all but the functions is ignored. */
    explicit Host(const flvd_init_t& functions) : m_functions(functions) {}
    const flvd_init_t& functions() const { return m_functions; } /**< the block */

private:
    flvd_init_t m_functions;
};

/** A Host from a function of the host kit, such as flvd_posix_host_fill. */
inline Host make_host(void (*fill)(flvd_init_t*))
{
    flvd_init_t functions{};
    fill(&functions);
    return Host(functions);
}

/** Bytes that belong to somebody else. */
class Bytes {
public:
    constexpr Bytes() = default;
    /** Borrows `size` bytes from `data` on. */
    constexpr Bytes(const uint8_t* data, size_t size) : m_data(data), m_size(size) {}
    constexpr const uint8_t* data() const { return m_data; }           /**< the first; null when there is none */
    constexpr size_t size() const { return m_size; }                   /**< their number */
    constexpr bool empty() const { return m_size == 0; }               /**< true without bytes */
    constexpr const uint8_t* begin() const { return m_data; }          /**< the first */
    constexpr const uint8_t* end() const { return m_data + m_size; }   /**< behind the last */
    constexpr uint8_t operator[](size_t i) const { return m_data[i]; } /**< byte `i`, not checked */

private:
    const uint8_t* m_data = nullptr;
    size_t m_size = 0;
};

/* ------------------------------------------------------------------------------------------ errors */

/** What a failure means for the caller. */
enum class Kind {
    none,    /**< no failure */
    end,     /**< the end of the data */
    not_yet, /**< a growing file holds no more so far: ask, or open it, again later */
    miss,    /**< a seek found nothing to land on; playing goes on where it was */
    failed   /**< anything else */
};

/** A failure: the library's code and line, and what they mean. */
class error {
public:
    constexpr error() = default;
    /** From the library's code and line. */
    constexpr error(Kind kind, int32_t code, int32_t line) : m_kind(kind), m_code(code), m_line(line) {}

    constexpr Kind kind() const { return m_kind; }    /**< what it means for the caller */
    constexpr int32_t code() const { return m_code; } /**< FLVD_ERR_* */
    constexpr int32_t line() const { return m_line; } /**< number of the place of failure, the same in every release */
    const char* name() const { return flvd_error_name(m_code); } /**< such as "FLVD_ERR_SEEK" */
    const char* text() const { return flvd_error_text(m_code); } /**< what happened, for people */

private:
    Kind m_kind = Kind::none;
    int32_t m_code = FLVD_ERR_NONE;
    int32_t m_line = 0;
};

/**
 * A value, or the error that took its place. Access to a value that is not there is undefined: test first. Of a
 * temporary, `->` is refused: nobody can have tested it, and a range-for over what it leads to would outlive it.
 */
template <typename T> class [[nodiscard]] result {
public:
    result(T value) : m_value(std::move(value)) {}         /**< success */
    result(const flvdmx::error& error) : m_error(error) {} /**< failure */

    explicit operator bool() const { return m_value.has_value(); } /**< true when there is a value */
    T& operator*() & { return *m_value; }                          /**< the value */
    const T& operator*() const& { return *m_value; }               /**< the value */
    T&& operator*() && { return std::move(*m_value); }             /**< the value, to be taken */
    T* operator->() & { return &*m_value; }                        /**< of the value */
    const T* operator->() const& { return &*m_value; }             /**< of the value */
    T* operator->() && = delete;                                   /**< refused */
    flvdmx::error error() const { return m_error; }                /**< of Kind::none when there is a value */

private:
    std::optional<T> m_value;
    flvdmx::error m_error;
};

/* --------------------------------------------------------------------------------- what a file holds */

/** A stream. */
enum class Stream : uint32_t {
    any = 0,                   /**< in requests, without a separate audio reader: whatever comes next */
    video = FLVD_STREAM_VIDEO, /**< video */
    audio = FLVD_STREAM_AUDIO  /**< audio */
};

/** One frame, as the codec wants it: without FLV's headers. */
struct Frame {
    Stream stream = Stream::any; /**< video or audio */
    Milliseconds time{}; /**< from the file's first timestamp, in decoding order; negative: a tag in front of that */
    Bytes data;          /**< valid until the next call on the file */
};

/** The video stream; 0 in all that the file does not tell. */
struct VideoInfo {
    uint32_t width = 0;           /**< pixels */
    uint32_t height = 0;          /**< pixels */
    double frame_rate = 0.0;      /**< frames a second, from the metadata */
    std::string_view fourcc;      /**< as in flvd_video_info_t, empty for an unknown codec */
    Bytes config;                 /**< AVC: AVCDecoderConfigurationRecord */
    Milliseconds last_keyframe{}; /**< file timestamp, from the index or the metadata */
};

/** The audio stream; 0 in all that the file does not tell. */
struct AudioInfo {
    uint32_t sample_rate = 0; /**< Hz */
    uint32_t sample_size = 0; /**< bits */
    uint32_t channels = 0;    /**< their number */
    uint32_t format_tag = 0;  /**< FLVD_AUDIO_TAG_*, 0 for every other format */
    uint32_t data_rate = 0;   /**< kbit/s */
    Bytes config;             /**< AAC: AudioSpecificConfig */
};

/** How a file can be seeked in. */
enum class SeekMethod : uint32_t {
    none = FLVD_SEEK_NONE,         /**< not at all */
    by_index = FLVD_SEEK_BY_INDEX, /**< by the metadata's keyframe index */
    by_scan = FLVD_SEEK_BY_SCAN    /**< by stepping from tag to tag */
};

/** What is known of a file; views of it are valid until the file is closed. */
struct Info {
    std::string_view path;                     /**< as given to open() */
    Milliseconds duration{};                   /**< 0 when unknown, as of a growing file */
    int64_t size = 0;                          /**< bytes, 0 for a growing file */
    SeekMethod seek_method = SeekMethod::none; /**< how to seek in it */
    std::optional<VideoInfo> video;            /**< the video stream, if there is one */
    std::optional<AudioInfo> audio;            /**< the audio stream, if there is one */
};

/* -------------------------------------------------------------------------------- how it is opened */

/** How a file is opened. */
struct Options {
    uint32_t cache_size = 0;            /**< bytes of each reader's cache; 0: the library's choice */
    uint32_t scan_read_size = 0;        /**< bytes a read while scanning; 0: the library's choice */
    bool separate_audio_reader = false; /**< audio and video are asked for apart, each at its own pace */
    bool growing = false;               /**< the file may still be written: see File::follow() */
    bool index_in_memory = false;       /**< keep the keyframe index in memory: faster seeks */
    bool for_info_only = false; /**< frames and seeks are refused; opens faster: the duration may be the metadata's
                                     claim, and how to seek is not found out */
    uint8_t* buffer = nullptr;  /**< the caller's frame buffer, which must outlive the file; null: the library's
                                     own, which grows as needed. Frames that do not fit are passed over. */
    uint32_t buffer_size = 0;   /**< its bytes */
};

/** How to seek; modes are combined with |. */
enum class SeekMode : uint32_t {
    automatic = 0,                             /**< forward, unless the target is earlier than the current position */
    absolute = 0,                              /**< the time counts from the file's first timestamp */
    backward = FLVD_SEEK_BACKWARD,             /**< to the keyframe at or before the time */
    forward = FLVD_SEEK_FORWARD,               /**< to the keyframe at or after the time */
    relative = FLVD_SEEK_RELATIVE,             /**< the time counts from the current position */
    to_end_on_miss = FLVD_SEEK_TO_END_ON_MISS, /**< after a miss go to the end */
    retry_backward = FLVD_SEEK_RETRY_BACKWARD  /**< after a miss try backward, the time being absolute */
};

/** Both modes. */
constexpr SeekMode operator|(SeekMode a, SeekMode b)
{
    return static_cast<SeekMode>(static_cast<uint32_t>(a) | static_cast<uint32_t>(b));
}

/* ----------------------------------------------------------------------------------------- the file */

class FrameRange;

/** An open file. Moved, not copied; closes itself. A File that was moved from or closed answers FLVD_ERR_NO_INSTANCE.
 */
class File {
public:
    /**
     * Opens a file through the functions of `host`; they stay the process's, see above. The path is copied.
     * @return the file; Kind::not_yet when a growing file does not hold a file header and the beginning of a stream,
     *         which more bytes may bring; Kind::failed
     * @note What the open did not find is not found later: look at info() for the streams that are awaited, and open
     *       a growing file again while one is missing.
     */
    static result<File> open(std::string_view path, const Host& host, const Options& options = {})
    {
        File file;
        file.m_path.reset(new (std::nothrow) char[path.size() + 1]);
        if (file.m_path == nullptr)
            return error(Kind::failed, FLVD_ERR_INSTANCE_MEMORY, 0);
        path.copy(file.m_path.get(), path.size());
        file.m_path[path.size()] = '\0';
        file.m_request = {options.buffer, options.buffer_size, 0};
        const flvd_init_t init = file.fill_init(host, options);
        const uint32_t operation = options.for_info_only ? FLVD_OP_OPEN_INFO : FLVD_OP_OPEN;
        const std::lock_guard<std::recursive_mutex> lock(open_mutex);
        if (QVX_FLV_DMX(operation, &file.m_instance, &init, &file.m_info) != 0)
            return error(kind_of(g_flvd_lLastError, options.growing), g_flvd_lLastError, g_flvd_lErrorLine);
        return result<File>(std::move(file));
    }

    /** Opens a file through the stdio host. */
    static result<File> open(std::string_view path, const Options& options = {})
    {
        return open(path, make_host(flvd_stdio_host_fill), options);
    }

    /** Takes the open file over. */
    File(File&& other) noexcept { swap(other); }
    /** Closes this file and takes the other over. */
    File& operator=(File&& other) noexcept
    {
        File taken(std::move(other));
        swap(taken);
        return *this;
    }
    File(const File&) = delete;
    File& operator=(const File&) = delete;
    ~File() { close(); } /**< closes the file */

    /** Closes the file; all views of it end. */
    void close()
    {
        if (m_instance == nullptr)
            return;
        const std::lock_guard<std::recursive_mutex> lock(open_mutex);
        QVX_FLV_DMX(FLVD_OP_CLOSE, &m_instance, nullptr, nullptr);
        m_instance = nullptr;
        m_info = {};
    }

    bool is_open() const { return m_instance != nullptr; } /**< false when closed or moved from */

    /** The C interface's instance, for what is not wrapped here; null when nothing is open. */
    flvd_ctx_t* instance() const { return m_instance; }

    /** What is in the file; empty when nothing is open. */
    Info info() const
    {
        Info info;
        if (m_instance == nullptr)
            return info;
        info.path = m_info.file_info->file_name;
        info.duration = Milliseconds(m_info.file_info->duration_ms);
        info.size = m_info.file_info->file_size;
        info.seek_method = static_cast<SeekMethod>(m_info.file_info->seek_method);
        if (m_info.video_info != nullptr)
            info.video = describe(*m_info.video_info);
        if (m_info.audio_info != nullptr)
            info.audio = describe(*m_info.audio_info);
        return info;
    }

    /**
     * The next frame, as flvd_next_frame() finds it: damaged stretches of any length are crossed.
     *
     * @param stream with a separate audio reader video or audio; without one it is not looked at
     * @return the frame; Kind::end, for a growing file Kind::not_yet; Kind::failed
     */
    result<Frame> next_frame(Stream stream = Stream::any)
    {
        m_request.stream = static_cast<uint32_t>(stream);
        flvd_frame_t frame{};
        if (flvd_next_frame(m_instance, &m_request, &frame) != 0)
            return failure();
        return describe(frame);
    }

    /**
     * The next frame of a growing file. While there is none yet, `wait` is called and the file is asked again; when
     * `wait` returns false, because writing has stopped, it is asked one last time.
     *
     * @param wait   bool(): sleeps for a while, true when the file may have grown since
     * @param stream as of next_frame()
     * @return as next_frame()
     */
    template <typename Wait> result<Frame> follow(Wait&& wait, Stream stream = Stream::any)
    {
        for (bool again = true;;) {
            result<Frame> frame = next_frame(stream);
            if (frame.error().kind() != Kind::not_yet || !again)
                return frame;
            again = wait();
        }
    }

    /** For range-for: frames up to the first request that fails; last_error() tells why it ended. */
    inline FrameRange frames(Stream stream = Stream::any) &;

    /**
     * Seeks to a keyframe, without video to an audio frame. After a miss or a failure playing goes on where it was.
     *
     * @param time from the first timestamp; with SeekMode::relative from the current position. What does not fit 32
     *             bits counts as the greatest or least time that does.
     * @param mode how to get there
     * @return the time reached, from the first timestamp; Kind::miss; Kind::failed
     */
    result<Milliseconds> seek(Milliseconds time, SeekMode mode = SeekMode::automatic)
    {
        const flvd_seek_request_t request = {clamp(time), static_cast<uint32_t>(mode)};
        int32_t reached = 0;
        if (QVX_FLV_DMX(FLVD_OP_SEEK, &m_instance, &request, &reached) != 0)
            return failure();
        return Milliseconds(reached);
    }

    /** The last failure of this file, of Kind::none when there was none; later successes leave it in place. */
    error last_error() const { return failure(); }

private:
    File() = default;

    void swap(File& other) noexcept
    {
        std::swap(m_path, other.m_path);
        std::swap(m_instance, other.m_instance);
        std::swap(m_info, other.m_info);
        std::swap(m_request, other.m_request);
    }

    static constexpr uint32_t bits_if(bool set, uint32_t bits) { return set ? bits : 0; }

    flvd_init_t fill_init(const Host& host, const Options& options) const
    {
        flvd_init_t init = host.functions();
        init.file_name = m_path.get();
        init.cache_size = options.cache_size;
        init.scan_read_size = options.scan_read_size;
        init.options = bits_if(options.separate_audio_reader, FLVD_OPT_SEPARATE_AUDIO_READER) |
                       bits_if(options.buffer != nullptr, FLVD_OPT_USER_BUFFER) |
                       bits_if(options.growing, FLVD_OPT_PROGRESSIVE) |
                       bits_if(options.index_in_memory, FLVD_OPT_INDEX_IN_MEMORY);
        return init;
    }

    static Kind kind_of(int32_t code, bool growing)
    {
        switch (code) {
        case FLVD_ERR_NONE:
            return Kind::none;
        case FLVD_ERR_SEEK_MISS:
            return Kind::miss;
        case FLVD_ERR_SHORT_DATA:
            return growing ? Kind::not_yet : Kind::end;
        case FLVD_ERR_NO_STREAM:
        case FLVD_ERR_FILE_HEADER:
            return growing ? Kind::not_yet : Kind::failed;
        default:
            return Kind::failed;
        }
    }

    error failure() const
    {
        if (m_instance == nullptr)
            return {Kind::failed, FLVD_ERR_NO_INSTANCE, 0};
        const bool growing = (m_instance->options & FLVD_OPT_PROGRESSIVE) != 0;
        return {kind_of(m_instance->error, growing), m_instance->error, m_instance->error_line};
    }

    // Only a tag before the first timestamp wraps, and every tag that is taken lies at or before the last one.
    Frame describe(const flvd_frame_t& frame) const
    {
        const bool wrapped = m_instance->first_ts != 0 && frame.timestamp_ms > m_instance->duration_ms;
        const int64_t time = int64_t{frame.timestamp_ms} - (wrapped ? int64_t{1} << 32 : 0);
        return {static_cast<Stream>(frame.stream), Milliseconds(time), Bytes(frame.data, frame.size)};
    }

    static VideoInfo describe(const flvd_video_info_t& video)
    {
        const size_t fourcc = video.fourcc[0] == '\0' ? 0 : sizeof video.fourcc;
        return {video.width,
                video.height,
                video.frame_rate / 1000.0,
                {video.fourcc, fourcc},
                {video.config, video.config_size},
                Milliseconds(video.last_key_time_ms)};
    }

    static AudioInfo describe(const flvd_audio_info_t& audio)
    {
        return {audio.sample_rate, audio.sample_size, audio.channels,
                audio.format_tag,  audio.data_rate,   {audio.config, audio.config_size}};
    }

    static int32_t clamp(Milliseconds time)
    {
        using Limits = std::numeric_limits<int32_t>;
        if (time.count() > Limits::max())
            return Limits::max();
        return time.count() < Limits::min() ? Limits::min() : static_cast<int32_t>(time.count());
    }

    std::unique_ptr<char[]> m_path; // the library keeps the address
    flvd_ctx_t* m_instance = nullptr;
    flvd_open_info_t m_info{};
    flvd_frame_request_t m_request{};
};

/** The frames of a file from where it stands, for one range-for. */
class FrameRange {
public:
    /** The end of the range. */
    struct Sentinel {};

    /** The place in the range; all of them of one range are the same place. */
    class Iterator {
    public:
        explicit Iterator(FrameRange* range) : m_range(range) {}       /**< of a range whose frame was taken */
        const Frame& operator*() const { return *m_range->m_frame; }   /**< the frame */
        const Frame* operator->() const { return &*m_range->m_frame; } /**< of the frame */
        /** Takes the next frame. */
        Iterator& operator++()
        {
            m_range->advance();
            return *this;
        }
        bool operator!=(Sentinel) const { return static_cast<bool>(m_range->m_frame); } /**< true at a frame */
        bool operator==(Sentinel) const { return !m_range->m_frame; }                   /**< true behind the last */

    private:
        FrameRange* m_range;
    };

    FrameRange(File& file, Stream stream) : m_file(file), m_stream(stream) {} /**< see File::frames() */
    /** Takes the first frame. */
    Iterator begin()
    {
        advance();
        return Iterator(this);
    }
    static Sentinel end() { return {}; } /**< where every range ends */

private:
    void advance() { m_frame = m_file.next_frame(m_stream); }

    File& m_file;
    Stream m_stream;
    result<Frame> m_frame = flvdmx::error();
};

inline FrameRange File::frames(Stream stream) &
{
    return {*this, stream};
}

} // namespace flvdmx

#endif /* FLVDMX_FLVDMX_HPP */
