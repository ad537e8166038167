/*
 * flvdmx for C++17: one open file as an object over the C interface of flvdmx.h. Header only; link flvdmx-host.
 *
 *     auto file = flvdmx::File::open("clip.flv");
 *     if (!file)
 *         return std::fprintf(stderr, "%s\n", file.error().text());
 *     if (file->info().video)
 *         configure(flvdmx::Stream::video, file->info().video->config); // the same for audio
 *     for (const flvdmx::Frame& frame : file->frames()) {
 *         if (frame.config_changed())
 *             configure(frame.stream, frame.new_config);
 *         play(frame.stream, frame.presentation_time(), frame.data);
 *     }
 *
 * What can fail returns a result<T>. Nothing needs exceptions or run-time type information; only texts, lists and codec
 * configurations take memory from operator new, which may throw. All else comes from the host.
 *
 * MISTAKES
 *
 * A File that is not open (closed, moved from, never opened) answers every call with FLVD_ERR_NO_INSTANCE, a result
 * without a value holds an empty one, and an open that would break files that are open already is refused. What must be
 * kept in mind is how long Frame::data is valid, and the rules for threads.
 *
 * THE PROCESS-WIDE TABLES
 *
 * The library calls the memory and file functions of its host. They carry no context, so there is one set of them for
 * the process: every open overwrites it, and all files that are open already go on with the newest functions. Hence:
 *
 * - Files that are open at the same time have one host. File::open(path) takes the stdio host; the other hosts of the
 *   kit, and hosts of your own, are passed as a Host. While a File is open, an open through other functions returns
 *   FLVD_ERR_HOST_IN_USE. What differs from file to file belongs in a callback file (flvdmx/callback_host.h).
 * - Opening and closing hold open_mutex, so threads may open files, look at their Info and let them go as they like.
 *   All other calls take no lock, and an open must not run beside them, on whatever File: when threads play files while
 *   others open some, they hold open_mutex around their own calls as well.
 * - One File is used by one thread at a time. Calls on different Files may run at the same time.
 */
#ifndef FLVDMX_FLVDMX_HPP
#define FLVDMX_FLVDMX_HPP

#if __cplusplus < 201703L
#error "flvdmx.hpp needs C++17"
#endif

#include "flvdmx/error_text.h"
#include "flvdmx/flvdmx.h"
#include "flvdmx/layers.h"
#include "flvdmx/metadata.hpp"
#include "flvdmx/next_frame.h"
#include "flvdmx/result.hpp"
#include "flvdmx/stdio_host.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <chrono>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <limits>
#include <memory>
#include <mutex>
#include <new>
#include <optional>
#include <string>
#include <string_view>
#include <tuple>
#include <utility>
#include <vector>

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
    // What the library calls.
    static auto called(const flvd_init_t& f)
    {
        return std::tie(f.mem_alloc, f.mem_free, f.mem_copy, f.mem_set, f.file_open, f.file_read, f.file_close,
                        f.file_eof, f.file_seek, f.file_tell, f.file_seek64, f.file_tell64, f.file_flush, f.file_write);
    }

public:
    /** From a block of which all but the functions is ignored. */
    explicit Host(const flvd_init_t& functions) : m_functions(functions) {}
    const flvd_init_t& functions() const { return m_functions; } /**< the block */

    /** True when all functions that the library calls are there. */
    bool is_complete() const
    {
        const flvd_init_t& f = m_functions;
        return f.mem_alloc != nullptr && f.mem_free != nullptr && f.mem_copy != nullptr && f.mem_set != nullptr &&
               f.file_open != nullptr && f.file_read != nullptr && f.file_close != nullptr && f.file_eof != nullptr &&
               f.file_seek != nullptr && f.file_tell != nullptr;
    }

    /** True for a host with the same functions. */
    bool operator==(const Host& other) const { return called(m_functions) == called(other.m_functions); }
    bool operator!=(const Host& other) const { return !(*this == other); } /**< true for a host with others */

private:
    flvd_init_t m_functions;
};

/** A Host from a function of the host kit, such as flvd_posix_host_fill; an incomplete one from null. */
inline Host make_host(void (*fill)(flvd_init_t*))
{
    flvd_init_t functions{};
    if (fill != nullptr)
        fill(&functions);
    return Host(functions);
}

/* --------------------------------------------------------------------------------- what a file holds */

/** A stream. */
enum class Stream : uint32_t {
    any = 0,                   /**< in requests, without a separate audio reader: whatever comes next */
    video = FLVD_STREAM_VIDEO, /**< video */
    audio = FLVD_STREAM_AUDIO  /**< audio */
};

/**
 * One frame, without the headers of FLV. AVC: NAL units, each after its length, a big-endian number of as many bytes as
 * the configuration says (mostly 4), and no parameter sets: those are in the configuration. AAC: a raw access unit,
 * without ADTS. VP6: the bytes of FLV that tell how the picture is cropped come first.
 */
struct Frame {
    Stream stream = Stream::any; /**< video or audio */
    Milliseconds time{}; /**< when to decode it, from the first timestamp of the file; negative: a tag before that */
    Bytes data;          /**< valid until the next call on the file other than info() */
    Milliseconds composition_offset{}; /**< from decoding to showing it, may be negative; 0 unless the codec is AVC */
    bool keyframe = false; /**< it can be decoded without the frames before it; true for every audio frame */
    int64_t position = -1; /**< byte in the file where its tag begins; -1 when the host failed to tell */
    Bytes new_config;      /**< the stream's configuration from this frame on, when another held for the frame before;
                                else empty. Valid as long as `data`. */

    Milliseconds presentation_time() const { return time + composition_offset; } /**< when to show it */
    bool config_changed() const { return !new_config.empty(); } /**< true: give `new_config` to the decoder first */
};

/** CodecID of video tags (FLV file format, version 10.1, annex E.4.3.1). Files may hold other numbers. */
enum class VideoCodec : uint32_t {
    unknown = 0,        /**< none */
    jpeg = 1,           /**< JPEG */
    sorenson_h263 = 2,  /**< Sorenson H.263 */
    screen_video = 3,   /**< screen video */
    vp6 = 4,            /**< On2 VP6 */
    vp6_alpha = 5,      /**< On2 VP6 with an alpha channel */
    screen_video_2 = 6, /**< screen video, version 2 */
    avc = 7             /**< AVC, H.264 */
};

/** SoundFormat of audio tags (the same, annex E.4.2.1). Files may hold other numbers. */
enum class AudioCodec : uint32_t {
    pcm = 0,               /**< linear PCM in the byte order of the machine that wrote it */
    adpcm = 1,             /**< ADPCM */
    mp3 = 2,               /**< MP3 */
    pcm_little_endian = 3, /**< linear PCM, little-endian */
    nellymoser_16khz = 4,  /**< Nellymoser, 16 kHz, mono */
    nellymoser_8khz = 5,   /**< Nellymoser, 8 kHz, mono */
    nellymoser = 6,        /**< Nellymoser */
    a_law = 7,             /**< G.711 A-law */
    mu_law = 8,            /**< G.711 mu-law */
    unknown = 9,           /**< reserved in the format */
    aac = 10,              /**< AAC */
    speex = 11,            /**< Speex */
    mp3_8khz = 14,         /**< MP3, 8 kHz */
    device_specific = 15   /**< whatever a device wrote */
};

/** @return the codec's name for people; "unknown" for a number that the format does not define */
constexpr const char* name(VideoCodec codec)
{
    constexpr std::array names = {"unknown", "JPEG",           "Sorenson H.263", "screen video",
                                  "VP6",     "VP6 with alpha", "screen video 2", "H.264 (AVC)"};
    const auto number = static_cast<size_t>(codec);
    return number < names.size() ? names[number] : names[0];
}

/** @return as for video */
constexpr const char* name(AudioCodec codec)
{
    constexpr std::array names = {"PCM",
                                  "ADPCM",
                                  "MP3",
                                  "PCM, little-endian",
                                  "Nellymoser 16 kHz mono",
                                  "Nellymoser 8 kHz mono",
                                  "Nellymoser",
                                  "G.711 A-law",
                                  "G.711 mu-law",
                                  "unknown",
                                  "AAC",
                                  "Speex",
                                  "unknown",
                                  "unknown",
                                  "MP3 8 kHz",
                                  "device-specific sound"};
    const auto number = static_cast<size_t>(codec);
    return number < names.size() ? names[number] : "unknown";
}

/** The video stream; 0 in all that the file does not tell. */
struct VideoInfo {
    VideoCodec codec = VideoCodec::unknown; /**< what its frames are */
    uint32_t width = 0;                     /**< pixels */
    uint32_t height = 0;                    /**< pixels */
    double frame_rate = 0.0;                /**< frames per second, from the metadata */
    std::string fourcc;                     /**< as in flvd_video_info_t, empty for an unknown codec */
    std::vector<uint8_t> config;            /**< AVC: the first AVCDecoderConfigurationRecord (ISO/IEC 14496-15) */
    Milliseconds last_keyframe{};           /**< file timestamp, from the index or the metadata */
};

/**
 * The audio stream; 0 in all that the file does not tell. Sample rate, sample size and channels of AAC and MP3 are the
 * codec's own. Those of all other codecs are the tag header's, which knows 5.5, 11, 22 and 44.1 kHz alone and can be
 * wrong: Speex has 16 kHz and one channel, A-law, mu-law and Nellymoser mostly 8 or 16 kHz, whatever stands there.
 */
struct AudioInfo {
    AudioCodec codec = AudioCodec::unknown; /**< what its frames are */
    uint32_t sample_rate = 0;               /**< Hz */
    uint32_t sample_size = 0;               /**< bits */
    uint32_t channels = 0;                  /**< their number */
    uint32_t format_tag = 0;                /**< FLVD_AUDIO_TAG_*, 0 for every other format */
    uint32_t data_rate = 0;                 /**< kbit/s */
    std::vector<uint8_t> config;            /**< AAC: the first AudioSpecificConfig (ISO/IEC 14496-3) */
};

/** How seeks find their way. */
enum class SeekMethod : uint32_t {
    none = FLVD_SEEK_NONE,         /**< not at all */
    by_index = FLVD_SEEK_BY_INDEX, /**< by the metadata's keyframe index */
    by_scan = FLVD_SEEK_BY_SCAN    /**< by stepping from tag to tag */
};

/** What was known of a file when it had been opened. A copy: it stays as it is. */
struct Info {
    std::string path;          /**< as given to open() */
    Milliseconds start_time{}; /**< first timestamp of the file, from which all times count; 0 for a
                                    growing file */
    Milliseconds duration{};   /**< last timestamp less the first; 0 when unknown, as of a growing file */
    int64_t size = 0;          /**< bytes, 0 for a growing file */
    SeekMethod seek_method = SeekMethod::none; /**< how seeks find their way */
    std::optional<VideoInfo> video;            /**< the video stream, if there is one */
    std::optional<AudioInfo> audio;            /**< the audio stream, if there is one */
};

/** A keyframe of the list. */
struct Keyframe {
    Milliseconds time{};  /**< from the first timestamp of the file */
    int64_t position = 0; /**< byte in the file where its tag begins */
};

/* -------------------------------------------------------------------------------- how it is opened */

/** How a file is opened. */
struct Options {
    uint32_t cache_size = 0;            /**< bytes of each reader's cache; 0: the library's choice */
    uint32_t scan_read_size = 0;        /**< bytes per read while scanning; 0: the library's choice */
    bool separate_audio_reader = false; /**< audio and video are asked for apart, each at its own pace */
    bool growing = false;               /**< the file may still be written: see File::follow() */
    bool index_in_memory = false;       /**< keep the keyframe index in memory: faster seeks */
    bool for_info_only = false; /**< frames and seeks are refused; opens faster: the duration may be the metadata's
                                     claim, and how to seek is not found out */
    uint8_t* buffer = nullptr;  /**< the caller's frame buffer, which must outlive the file; null: the library's
                                     own, which grows as needed. Frames that do not fit are passed over. */
    uint32_t buffer_size = 0;   /**< its bytes */
    bool restarting_timestamps = false; /**< deliver all frames, also those later than the file's last timestamp, as a
                                             recording has whose timestamps start again; times may jump back, and
                                             seeking is refused */
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

/** An open file. Moved, not copied; closes itself. */
class File {
public:
    /** A File that is not open. */
    File() = default;

    /**
     * Opens a file through the functions of `host`; they stay the process's, see above. The path is copied.
     * @return the file; Kind::not_yet when a growing file does not hold a file header and the beginning of a stream,
     *         which more bytes may bring; Kind::failed, with the system's reason when it could not be opened;
     *         FLVD_ERR_HOST_IN_USE, FLVD_ERR_HOST_INCOMPLETE
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
        const error failure = file.open_instance(host, options);
        if (failure.kind() != Kind::none)
            return failure;
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

    /** Closes the file; the data of its frames is gone. */
    void close()
    {
        if (m_instance == nullptr || m_walking)
            return;
        const std::lock_guard<std::recursive_mutex> lock(open_mutex);
        QVX_FLV_DMX(FLVD_OP_CLOSE, &m_instance, nullptr, nullptr);
        m_instance = nullptr;
        m_return = {};
        --m_open_files;
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
        info.path = m_path.get();
        info.start_time = Milliseconds(m_instance->first_ts);
        info.duration = Milliseconds(m_instance->duration_ms);
        info.size = m_instance->file_size;
        info.seek_method = static_cast<SeekMethod>(m_instance->seek_method);
        if ((m_instance->streams & FLVD_STREAM_VIDEO) != 0)
            info.video = describe_video();
        if ((m_instance->streams & FLVD_STREAM_AUDIO) != 0)
            info.audio = describe_audio();
        return info;
    }

    /**
     * The script data at the beginning of the file: the script tags among the first 102 tags, of each the first MiB.
     * Playing goes on where it was.
     * @return the properties, none when the file has none; Kind::failed
     */
    result<Metadata> metadata()
    {
        if (const error failed = leave(); failed.kind() != Kind::none)
            return failed;
        Metadata metadata;
        if (move_to(m_return.reader, m_instance->data_offset))
            read_script_tags(m_return.reader, metadata);
        go_back();
        return metadata;
    }

    /**
     * All keyframes of the video, those of a growing file so far. A file that seeks by its keyframe index has them
     * there, as the index tells them; else the whole file is walked, tag by tag. Playing goes on where it was.
     *
     * @param progress bool(int64_t reached, int64_t size): called after each keyframe on that walk, with the bytes
     *                 walked and those of the file, 0 for a growing one; when it returns false the list ends there.
     * While it runs, all that it asks of this File fails, and closing does nothing.
     * @return the keyframes in file order, none without video; Kind::failed
     */
    template <typename Progress> result<std::vector<Keyframe>> keyframes(Progress&& progress)
    {
        if (const error failed = leave(); failed.kind() != Kind::none)
            return failed;
        fio_file_t* const reader = m_return.reader;
        std::vector<Keyframe> list;
        if ((m_instance->streams & FLVD_STREAM_VIDEO) != 0) {
            if (m_instance->seek_method == FLVD_SEEK_BY_INDEX)
                list = read_index(reader);
            if (list.empty() && move_to(reader, m_instance->data_offset)) {
                m_walking = true;
                list = walk_keyframes(reader, progress);
                m_walking = false;
            }
        }
        go_back();
        return list;
    }

    /** The same without a report of progress. */
    result<std::vector<Keyframe>> keyframes()
    {
        return keyframes([](int64_t, int64_t) { return true; });
    }

    /**
     * The next frame, as flvd_next_frame() finds it: damaged stretches of any length are crossed.
     *
     * A codec configuration that differs from the one before it is reported with the first frame after it; a copy of
     * the same configuration is not. A seek back to frames that were played before reports theirs again. What a seek
     * jumps over is not looked at: until playing has passed it, a change in there is not known.
     *
     * @param stream with a separate audio reader video or audio; without one it is not looked at
     * @return the frame; Kind::end, for a growing file Kind::not_yet; Kind::failed
     */
    result<Frame> next_frame(Stream stream = Stream::any)
    {
        result<Frame> frame{Frame()};
        if (!take(stream, *frame))
            return failure();
        return frame;
    }

    /**
     * The next frame, as next_frame(), written into memory of the caller, who can pass it on without a copy. For files
     * that were opened with Options::buffer, and without a separate audio reader: the frames whose size is not known
     * before the request go to that buffer, as those after damage or a configuration do.
     *
     * @param allocate uint8_t*(uint32_t size): memory for a frame of `size` bytes, or null when there is none; called
     *                 at most once
     * @return as next_frame(); the data lies either at what `allocate` returned or in Options::buffer
     */
    template <typename Allocate> result<Frame> next_frame_into(Allocate&& allocate)
    {
        if (!can_read())
            return failure();
        fio_file_t* const reader = m_instance->main_reader;
        const int64_t begin = m_next[0] >= 0 ? m_next[0] : __FLV_DMX__fioTell64(reader);
        const Tag ahead(reader, begin);
        const uint32_t size = ahead.end() <= m_instance->data_end ? ahead.frame_size() : 0;
        uint8_t* const memory = size != 0 ? allocate(size) : nullptr;
        if (memory == nullptr)
            return next_frame();
        const auto given = m_given;
        const flvd_frame_request_t request = std::exchange(m_request, {memory, size, 0});
        result<Frame> frame = next_frame();
        m_request = request;
        if (frame && frame->position == begin)
            return frame;
        // What looked like a tag was none, and a frame that does not fit may have been passed over.
        m_given = given;
        m_next[0] = begin;
        m_return = {reader, begin};
        return next_frame();
    }

    /**
     * Tells whether there is no damage between two places. Playing goes on where it was.
     *
     * @param from byte in the file where a tag begins
     * @param to   byte after it
     * @return true when whole tags fill what is between
     */
    bool has_whole_tags(int64_t from, int64_t to)
    {
        if (leave().kind() != Kind::none)
            return false;
        fio_file_t* const reader = m_return.reader;
        int64_t reached = from;
        while (reached < to && move_to(reader, reached)) {
            const Tag tag = find_tag(reader, FLVD_TAG_VIDEO | FLVD_TAG_AUDIO | FLVD_TAG_SCRIPT);
            if (tag.position != reached)
                break;
            reached = tag.end();
        }
        go_back();
        return reached == to;
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
     * Seeks to a keyframe, without video to an audio frame. After a miss or a failure playing continues where it was,
     * unless the mode puts the file at its end.
     *
     * Time 0, and whatever is before it, is the first tag, whatever its time. By an index, whose times muxers round or
     * count from elsewhere, "at or before" holds for the times of the index: the frame can be a few milliseconds later.
     * In a growing file seeking needs timestamps that begin at 0, video, and Options::index_in_memory.
     *
     * @param time from the first timestamp; with SeekMode::relative from the current position. What does not fit 32
     *             bits counts as the greatest or least time that does.
     * @param mode how to get there
     * @return the time reached, from the first timestamp; Kind::miss; Kind::failed
     */
    result<Milliseconds> seek(Milliseconds time, SeekMode mode = SeekMode::automatic)
    {
        if (!can_read())
            return failure();
        m_next = {-1, -1};
        const flvd_seek_request_t request = {clamp<int32_t>(time.count()), static_cast<uint32_t>(mode)};
        int32_t reached = 0;
        if (QVX_FLV_DMX(FLVD_OP_SEEK, &m_instance, &request, &reached) != 0)
            return failure();
        return Milliseconds(reached);
    }

    /** The last failure of this file, of Kind::none when there was none; later successes leave it in place. */
    error last_error() const { return failure(); }

private:
    friend FrameRange; // takes frames without a copy

    // Of a tag (FLV file format, version 10.1, annex E.4).
    static constexpr uint32_t tag_header_size = 11;
    static constexpr uint32_t back_pointer_size = 4;
    static constexpr uint32_t metadata_tags = 102;        // as many as an open looks at
    static constexpr uint32_t script_data_max = 1u << 20; // bytes read of one script tag
    static constexpr size_t changes_max = 256;            // configurations remembered

    // A tag header and the five bytes after it, of which a codec header has 1, 2 or 5.
    class Tag {
    public:
        int64_t position = -1; // in the file; -1: no tag

        Tag() = default;
        // The tag at the reader's position, which is given. None when fewer bytes than a tag has are left.
        Tag(fio_file_t* reader, int64_t at)
        {
            const uint8_t* bytes = reader->cache + reader->head; // seen without a call when it is cached
            const bool cached = reader->count >= sizeof m_bytes;
            if (!cached && __FLV_DMX__fioShowBytesByPtr(&bytes, sizeof m_bytes, reader) < sizeof m_bytes)
                return;
            std::memcpy(m_bytes, bytes, sizeof m_bytes);
            position = at;
        }

        bool is_video() const { return m_bytes[0] == FLVD_TAG_TYPE_VIDEO; }
        bool is_audio() const { return m_bytes[0] == FLVD_TAG_TYPE_AUDIO; }
        Stream stream() const { return is_video() ? Stream::video : is_audio() ? Stream::audio : Stream::any; }
        uint32_t data_size() const { return word(0) & 0xFFFFFF; }
        uint32_t timestamp() const { return word(4) >> 8 | uint32_t{m_bytes[7]} << 24; }
        int64_t end() const { return position + tag_header_size + data_size() + back_pointer_size; }
        bool is_keyframe() const { return is_audio() || m_bytes[11] >> 4 == 1 || m_bytes[11] >> 4 == 4; }

        uint32_t codec_header_size() const { return is_avc() ? 5 : is_aac() ? 2 : 1; }
        // What the packet type of AVC and AAC says: a configuration, a frame, or neither.
        bool is_config() const { return (is_avc() || is_aac()) && m_bytes[12] == 0; }
        bool has_frame() const { return !is_config() && !(is_avc() && m_bytes[12] == 2); }
        // 0 for a tag without a frame.
        uint32_t frame_size() const
        {
            const bool carries_frame = (is_video() || is_audio()) && has_frame() && data_size() > codec_header_size();
            return carries_frame ? data_size() - codec_header_size() : 0;
        }
        int32_t composition_offset() const
        {
            constexpr int32_t sign = 1 << 23;
            return is_avc() ? (static_cast<int32_t>(word(12) & 0xFFFFFF) ^ sign) - sign : 0;
        }

        // True when the frame, after which its reader stands at `frame_end`, is that of this tag.
        bool carries(const flvd_frame_t& frame, int64_t frame_end) const
        {
            const uint32_t type = frame.stream == FLVD_STREAM_VIDEO ? FLVD_TAG_TYPE_VIDEO : FLVD_TAG_TYPE_AUDIO;
            return word(0) == (type << 24 | (frame.size + codec_header_size())) && end() == frame_end;
        }

    private:
        bool is_avc() const { return is_video() && (m_bytes[11] & 15) == static_cast<uint8_t>(VideoCodec::avc); }
        bool is_aac() const { return is_audio() && m_bytes[11] >> 4 == static_cast<uint8_t>(AudioCodec::aac); }
        uint32_t word(size_t at) const
        {
            return uint32_t{m_bytes[at]} << 24 | uint32_t{m_bytes[at + 1]} << 16 | uint32_t{m_bytes[at + 2]} << 8 |
                   m_bytes[at + 3];
        }

        uint8_t m_bytes[tag_header_size + 5]{};
    };

    // A configuration that differs from the one before it, and where its tag begins.
    struct Change {
        int64_t position;
        Stream stream;
        std::vector<uint8_t> config;
    };

    // Where playing is when a reader is used for something else, or could not be put back.
    struct Return {
        fio_file_t* reader = nullptr;
        int64_t position = 0;
    };

    void swap(File& other) noexcept
    {
        std::swap(m_path, other.m_path);
        std::swap(m_instance, other.m_instance);
        std::swap(m_request, other.m_request);
        std::swap(m_return, other.m_return);
        std::swap(m_changes, other.m_changes);
        std::swap(m_given, other.m_given);
        std::swap(m_next, other.m_next);
    }

    /* Opening. */

    error open_instance(const Host& host, const Options& options)
    {
        m_request = {options.buffer, options.buffer_size, 0};
        const flvd_init_t init = fill_init(host, options);
        const uint32_t operation = options.for_info_only ? FLVD_OP_OPEN_INFO : FLVD_OP_OPEN;
        flvd_open_info_t info;
        const std::lock_guard<std::recursive_mutex> lock(open_mutex);
        if (!host.is_complete())
            return {Kind::failed, FLVD_ERR_HOST_INCOMPLETE, 0};
        if (m_open_files != 0 && host != m_host)
            return {Kind::failed, FLVD_ERR_HOST_IN_USE, 0};
        errno = 0;
        if (QVX_FLV_DMX(operation, &m_instance, &init, &info) != 0)
            return open_failure(options.growing, errno);
        m_host = host;
        ++m_open_files;
        if (options.restarting_timestamps)
            accept_all_times();
        return {};
    }

    static error open_failure(bool growing, int reason)
    {
        const int32_t code = g_flvd_lLastError;
        const bool refused = code == FLVD_ERR_OPEN_MAIN || code == FLVD_ERR_OPEN_AUDIO;
        return {kind_of(code, growing), code, g_flvd_lErrorLine, refused ? reason : 0};
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

    // Without a last timestamp a tag may have any; a seek would take it for the end of the file.
    void accept_all_times()
    {
        m_instance->last_ts = 0;
        m_instance->seek_method = FLVD_SEEK_NONE;
    }

    /* Failures. */

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

    bool is_growing() const { return (m_instance->options & FLVD_OPT_PROGRESSIVE) != 0; }

    error failure() const
    {
        if (m_instance == nullptr)
            return {Kind::failed, FLVD_ERR_NO_INSTANCE, 0};
        if (m_return.reader != nullptr)
            return {Kind::failed, FLVD_ERR_SEEK, 0};
        return {kind_of(m_instance->error, is_growing()), m_instance->error, m_instance->error_line};
    }

    /* Moving a reader and going back to where playing is, at the latest before the next call that reads. */

    static bool move_to(fio_file_t* reader, int64_t position)
    {
        return __FLV_DMX__fioSeek64(reader, position, FIO_SEEK_SET) == 0;
    }

    void go_back()
    {
        if (move_to(m_return.reader, m_return.position))
            m_return = {};
    }

    // False when nothing is open or a reader is not where playing is.
    bool can_read()
    {
        if (m_walking)
            return false;
        if (m_return.reader != nullptr)
            go_back();
        return m_instance != nullptr && m_return.reader == nullptr;
    }

    // The main reader is going to be used for something else than playing.
    error leave()
    {
        if (!can_read())
            return failure();
        const int64_t position = __FLV_DMX__fioTell64(m_instance->main_reader);
        if (position < 0)
            return {Kind::failed, FLVD_ERR_POSITION, 0};
        m_return = {m_instance->main_reader, position};
        return {};
    }

    // The first tag of a wanted kind from the reader's position on, by the library's own rules.
    Tag find_tag(fio_file_t* reader, uint32_t wanted) const
    {
        flvd_tag_info_t info;
        if (FLVD_GetCurrTagInfo(m_instance, reader, &info, wanted, is_growing() ? 0 : 1) != 0)
            return {};
        return {reader, __FLV_DMX__fioTell64(reader)};
    }

    /* Frames. */

    // The next frame, all its fields. False when there is none.
    bool take(Stream stream, Frame& frame)
    {
        if (!can_read())
            return false;
        const bool audio = stream == Stream::audio;
        fio_file_t* const reader = audio ? m_instance->audio_reader : m_instance->main_reader;
        int64_t begin = std::exchange(m_next[audio ? 1 : 0], -1);
        if (begin < 0)
            begin = __FLV_DMX__fioTell64(reader);
        Tag ahead(reader, begin);
        if (m_instance->main_reader != m_instance->audio_reader && !go_to_stream(reader, stream, ahead))
            return false;
        m_request.stream = static_cast<uint32_t>(stream);
        flvd_frame_t taken;
        if (request(taken) != 0)
            return false;
        const int64_t end = __FLV_DMX__fioTell64(reader);
        frame.stream = static_cast<Stream>(taken.stream);
        frame.time = time_of(taken.timestamp_ms + m_instance->first_ts);
        frame.data = {taken.data, taken.size};
        if (!ahead.carries(taken, end))
            ahead = look_again(taken, reader, ahead.position, end);
        frame.composition_offset = Milliseconds(ahead.composition_offset());
        frame.keyframe = frame.stream == Stream::audio || ahead.is_keyframe();
        frame.position = ahead.position;
        frame.new_config = m_changes.empty() ? Bytes() : changed_config(frame.stream, ahead.position);
        m_next[audio ? 1 : 0] = end;
        return true;
    }

    // Most requests bring a frame: flvd_next_frame only goes on where one does not.
    int32_t request(flvd_frame_t& frame)
    {
        const int32_t result = QVX_FLV_DMX(FLVD_OP_GET_FRAME, &m_instance, &m_request, &frame);
        return result == FLVD_RET_END ? flvd_next_frame(m_instance, &m_request, &frame) : result;
    }

    // With two readers the tags of the other stream come first: the library would cross them as well, and goes on from
    // the tag after them. False when the reader is no longer where playing is.
    [[gnu::noinline]] bool go_to_stream(fio_file_t* reader, Stream stream, Tag& ahead)
    {
        const bool found = (m_instance->streams & static_cast<uint32_t>(stream)) != 0;
        if (!found || ahead.position < 0 || ahead.stream() == stream)
            return true;
        const Return begin = {reader, ahead.position};
        ahead = find_tag(reader, stream == Stream::video ? FLVD_TAG_VIDEO : FLVD_TAG_AUDIO);
        if (ahead.position >= 0)
            return true;
        m_return = begin;
        return can_read();
    }

    // Of a file timestamp. One before the first is negative.
    Milliseconds time_of(uint32_t timestamp) const
    {
        return Milliseconds(int64_t{timestamp} - int64_t{m_instance->first_ts});
    }

    // After a frame before which tags were passed over: its tag, and what configurations are between. `from` is where
    // the reader stood before, `end` where it stands now.
    [[gnu::noinline]] Tag look_again(const flvd_frame_t& frame, fio_file_t* reader, int64_t from, int64_t end)
    {
        m_return = {reader, end};
        const Tag tag = tag_before(frame, reader, end);
        if (from >= 0 && from < tag.position && move_to(reader, from))
            learn_configs(reader, tag.position);
        go_back();
        return tag;
    }

    // The tag that ends at `end` and carries the frame.
    static Tag tag_before(const flvd_frame_t& frame, fio_file_t* reader, int64_t end)
    {
        for (const uint32_t codec_header : {5U, 2U, 1U}) {
            const int64_t begin = end - back_pointer_size - frame.size - codec_header - tag_header_size;
            const Tag tag = begin >= 0 && move_to(reader, begin) ? Tag(reader, begin) : Tag();
            if (tag.carries(frame, end))
                return tag;
        }
        return {};
    }

    void learn_configs(fio_file_t* reader, int64_t end)
    {
        for (int64_t reached = -1;;) {
            const Tag tag = find_tag(reader, FLVD_TAG_VIDEO | FLVD_TAG_AUDIO);
            if (tag.position <= reached || tag.position >= end)
                return;
            if (tag.is_config())
                learn_config(reader, tag);
            reached = tag.position;
            if (!move_to(reader, tag.end()))
                return;
        }
    }

    // One that does not fit the cache of the reader is none: they have a few dozen bytes.
    void learn_config(fio_file_t* reader, const Tag& tag)
    {
        const uint32_t headers = tag_header_size + tag.codec_header_size();
        const uint32_t size = tag_header_size + tag.data_size();
        const uint8_t* bytes = nullptr;
        if (size <= headers || __FLV_DMX__fioShowBytesByPtr(&bytes, size, reader) < size)
            return;
        const Bytes config(bytes + headers, size - headers);
        const Bytes before = config_at(change_at(tag.stream(), tag.position), tag.stream());
        if (std::equal(config.begin(), config.end(), before.begin(), before.end()))
            return;
        if (m_changes.size() == changes_max)
            m_changes.erase(m_changes.begin());
        const auto is_later = [&tag](const Change& change) { return change.position > tag.position; };
        m_changes.insert(std::find_if(m_changes.begin(), m_changes.end(), is_later),
                         {tag.position, tag.stream(), {config.begin(), config.end()}});
    }

    // The last change of a stream before a position; null: the configuration that the open found still holds.
    const Change* change_at(Stream stream, int64_t position) const
    {
        const Change* last = nullptr;
        for (const Change& change : m_changes)
            if (change.stream == stream && change.position <= position)
                last = &change;
        return last;
    }

    Bytes config_at(const Change* change, Stream stream) const
    {
        if (change != nullptr)
            return {change->config.data(), change->config.size()};
        return stream == Stream::video ? Bytes(m_instance->video_info.config, m_instance->video_info.config_size)
                                       : Bytes(m_instance->audio_info.config, m_instance->audio_info.config_size);
    }

    // The configuration of a frame, when it is not the one that was given last.
    [[gnu::noinline]] Bytes changed_config(Stream stream, int64_t position)
    {
        const Change* const change = change_at(stream, position);
        int64_t& given = m_given[stream == Stream::video ? 0 : 1];
        const int64_t now = change != nullptr ? change->position : -1;
        if (position < 0 || now == given)
            return {};
        given = now;
        return config_at(change, stream);
    }

    /* What the file says of itself. */

    VideoInfo describe_video() const
    {
        const flvd_video_info_t& video = m_instance->video_info;
        VideoInfo info;
        info.codec = static_cast<VideoCodec>(m_instance->video_codec_filter & 15); // the low half of the codec byte
        info.width = video.width;
        info.height = video.height;
        info.frame_rate = video.frame_rate / 1000.0;
        if (video.fourcc[0] != '\0')
            info.fourcc.assign(video.fourcc, sizeof video.fourcc);
        info.config.assign(video.config, video.config + video.config_size);
        info.last_keyframe = Milliseconds(video.last_key_time_ms);
        return info;
    }

    AudioInfo describe_audio() const
    {
        const flvd_audio_info_t& audio = m_instance->audio_info;
        AudioInfo info;
        info.codec = static_cast<AudioCodec>(m_instance->audio_format_filter >> 4 & 15); // the high half
        info.sample_rate = audio.sample_rate;
        info.sample_size = audio.sample_size;
        info.channels = audio.channels;
        info.format_tag = audio.format_tag;
        info.data_rate = audio.data_rate;
        info.config.assign(audio.config, audio.config + audio.config_size);
        return info;
    }

    void read_script_tags(fio_file_t* reader, Metadata& metadata) const
    {
        for (uint32_t tags = 0; tags < metadata_tags; ++tags) {
            const Tag tag = find_tag(reader, FLVD_TAG_VIDEO | FLVD_TAG_AUDIO | FLVD_TAG_SCRIPT);
            if (tag.position < 0)
                return;
            if (tag.stream() == Stream::any)
                read_script_tag(reader, tag, metadata);
            if (!move_to(reader, tag.end()))
                return;
        }
    }

    static void read_script_tag(fio_file_t* reader, const Tag& tag, Metadata& metadata)
    {
        std::vector<uint8_t> payload(std::min(tag.data_size(), script_data_max));
        __FLV_DMX__fioSkipBytes(tag_header_size, reader);
        const uint32_t size = __FLV_DMX__fioRead(payload.data(), 1, static_cast<uint32_t>(payload.size()), reader);
        metadata.add_script_data({payload.data(), size});
    }

    template <typename Progress> std::vector<Keyframe> walk_keyframes(fio_file_t* reader, Progress& progress) const
    {
        std::vector<Keyframe> list;
        for (int64_t reached = -1;;) {
            flvd_tag_info_t info;
            const uint32_t wanted = FLVD_TAG_VIDEO | FLVD_TAG_KEYFRAME;
            const bool found = FLVD_MoveToNextTag(m_instance, reader, &info, wanted, nullptr) == 0;
            const int64_t position = __FLV_DMX__fioTell64(reader);
            if (position <= reached || (!found && position >= m_instance->data_end))
                return list; // else the walk crosses damage
            reached = position;
            const Tag tag = found ? Tag(reader, position) : Tag();
            if (tag.position < 0 || !tag.has_frame())
                continue;
            list.push_back({time_of(tag.timestamp()), position});
            if (!progress(position, m_instance->file_size))
                return list;
        }
    }

    std::vector<Keyframe> read_index(fio_file_t* reader) const
    {
        std::vector<Keyframe> list;
        const flvd_keyframe_arrays_t& arrays = m_instance->keyframe_arrays;
        for (size_t i = 0; i < std::min(arrays.times_count, arrays.positions_count); ++i)
            list.push_back({time_of(arrays.times_ms[i]), arrays.positions[i]});
        if (!list.empty())
            return list;
        const flvd_keyframe_index_t& index = m_instance->keyframe_index;
        const std::vector<double> times = read_numbers(reader, index.times_offset, index.entry_count);
        const std::vector<double> positions = read_numbers(reader, index.positions_offset, index.entry_count);
        for (size_t i = 0; i < std::min(times.size(), positions.size()); ++i)
            list.push_back({time_of(clamp<uint32_t>(times[i] * 1000.0)), clamp<int64_t>(positions[i])});
        return list;
    }

    // Up to `count` elements of a strict array of AMF0; what is no number ends it.
    static std::vector<double> read_numbers(fio_file_t* reader, int64_t from, uint32_t count)
    {
        constexpr size_t element_size = 1 + sizeof(double); // marker 0, big-endian number
        std::vector<double> numbers;
        uint8_t element[element_size];
        if (from <= 0 || !move_to(reader, from))
            return numbers;
        while (numbers.size() < count && __FLV_DMX__fioRead(element, element_size, 1, reader) == 1 && element[0] == 0) {
            uint64_t bits = 0;
            for (size_t i = 1; i < element_size; ++i)
                bits = bits << 8 | element[i];
            std::memcpy(&numbers.emplace_back(), &bits, sizeof bits);
        }
        return numbers;
    }

    // What does not fit becomes the greatest or least number that does, what is no number the least.
    template <typename To, typename From> static To clamp(From value)
    {
        using Limits = std::numeric_limits<To>;
        if (value >= static_cast<From>(Limits::max()))
            return Limits::max();
        return value > static_cast<From>(Limits::min()) ? static_cast<To>(value) : Limits::min();
    }

    inline static Host m_host = make_host(nullptr); // of the files that are open, both under open_mutex
    inline static size_t m_open_files = 0;

    std::unique_ptr<char[]> m_path; // the library keeps the address
    flvd_ctx_t* m_instance = nullptr;
    flvd_frame_request_t m_request{};
    Return m_return;
    bool m_walking = false;                 // inside keyframes()
    std::vector<Change> m_changes;          // in file order
    std::array<int64_t, 2> m_given{-1, -1}; // positions of the changes that video and audio had last; -1: none
    std::array<int64_t, 2> m_next{-1, -1};  // where the main and the audio reader stand, when that is known; else -1
};

/** The frames of a file from where it stands, for one range-for. */
class FrameRange {
public:
    /** The end of the range. */
    struct Sentinel {};

    /** The place in the range; all of them of one range are the same place. */
    class Iterator {
    public:
        explicit Iterator(FrameRange* range) : m_range(range) {}      /**< of a range whose frame was taken */
        const Frame& operator*() const { return m_range->m_frame; }   /**< the frame; an empty one after the last */
        const Frame* operator->() const { return &m_range->m_frame; } /**< of the frame */
        /** Takes the next frame. */
        Iterator& operator++()
        {
            m_range->advance();
            return *this;
        }
        bool operator!=(Sentinel) const { return m_range->m_has_frame; }  /**< true at a frame */
        bool operator==(Sentinel) const { return !m_range->m_has_frame; } /**< true after the last */

    private:
        FrameRange* m_range;
    };

    FrameRange(File& file, Stream stream) : m_file(file), m_stream(stream) {} /**< see File::frames() */
    /** Takes the first frame. */
    Iterator begin() &
    {
        advance();
        return Iterator(this);
    }
    static Sentinel end() { return {}; } /**< where every range ends */

private:
    void advance()
    {
        m_has_frame = m_file.take(m_stream, m_frame);
        if (!m_has_frame)
            m_frame = Frame();
    }

    File& m_file;
    Stream m_stream;
    Frame m_frame;
    bool m_has_frame = false;
};

inline FrameRange File::frames(Stream stream) &
{
    return {*this, stream};
}

} // namespace flvdmx

#endif /* FLVDMX_FLVDMX_HPP */
