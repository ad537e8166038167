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
 * Functions that can fail return a result<T>. Neither exceptions nor run-time type information are needed. Strings,
 * lists and codec configurations are allocated with operator new, which may throw; all other memory comes from the
 * host.
 *
 * MISTAKES
 *
 * A File that is not open (closed, moved from, never opened) fails every call with FLVD_ERR_NO_INSTANCE, a result
 * without a value holds an empty one, and an open that would break other open files is refused. You are left with three
 * rules: Bytes are borrowed (those of a frame are valid until the next call, those of a configuration as long as the
 * Info that holds it), a FrameRange must not outlive its File, and the rules for threads below.
 *
 * THE PROCESS-WIDE TABLES
 *
 * The library calls the memory and file functions of its host. They carry no context, so there is one set per process:
 * every open replaces it, and files that are already open continue with the new functions. Therefore:
 *
 * - All files that are open at the same time share one host. File::open(path) uses the stdio host; pass the other hosts
 *   of the kit, or your own, as a Host. While a File is open, an open with other functions returns
 *   FLVD_ERR_HOST_IN_USE. If files need different functions, use callback files (flvdmx/callback_host.h).
 * - Opening and closing hold open_mutex, so threads may open files, read their Info and close them freely. Other calls
 *   take no lock, and no open may run at the same time as any of them, on any File: if some threads play files while
 *   others open files, hold open_mutex around the playing calls, too.
 * - Use a File from one thread at a time. Calls on different Files may run at the same time.
 * - open_mutex and the other process-wide state of this header are inline variables. Shared objects that hide their
 *   symbols each have a copy, so open files from only one of them.
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
#include "flvdmx/tag.hpp"

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
 * Held during every open, which writes the process-wide tables and reads the globals that hold the error of a failed
 * open, and during every close, which uses the tables. The thread that holds it may open and close files.
 */
inline std::recursive_mutex open_mutex;

/** All times and durations. */
using Milliseconds = std::chrono::milliseconds;

/** The host's functions. */
class Host {
    // The functions that the library calls.
    static auto called(const flvd_init_t& f)
    {
        return std::tie(f.mem_alloc, f.mem_free, f.mem_copy, f.mem_set, f.file_open, f.file_read, f.file_close,
                        f.file_eof, f.file_seek, f.file_tell, f.file_seek64, f.file_tell64, f.file_flush, f.file_write);
    }

public:
    /** Takes the functions from an initialisation block and ignores its other fields. */
    explicit Host(const flvd_init_t& functions) : m_functions(functions) {}
    const flvd_init_t& functions() const { return m_functions; } /**< the block */

    /** True when no function that the library needs is null. */
    bool is_complete() const
    {
        const flvd_init_t& f = m_functions;
        return f.mem_alloc != nullptr && f.mem_free != nullptr && f.mem_copy != nullptr && f.mem_set != nullptr &&
               f.file_open != nullptr && f.file_read != nullptr && f.file_close != nullptr && f.file_eof != nullptr &&
               f.file_seek != nullptr && f.file_tell != nullptr;
    }

    /** True if both have the same functions. */
    bool operator==(const Host& other) const { return called(m_functions) == called(other.m_functions); }
    bool operator!=(const Host& other) const { return !(*this == other); } /**< true if they differ */

private:
    flvd_init_t m_functions;
};

/** Makes a Host with a function of the host kit, such as flvd_posix_host_fill. Null makes an incomplete Host. */
inline Host make_host(void (*fill)(flvd_init_t*))
{
    flvd_init_t functions{};
    if (fill != nullptr)
        fill(&functions);
    return Host(functions);
}

/* --------------------------------------------------------------------------------- what a file holds */

/**
 * One frame, without FLV headers. AVC: NAL units, each preceded by its length, a big-endian number whose size is given
 * in the configuration (usually 4 bytes); parameter sets are only in the configuration. AAC: a raw access unit without
 * ADTS header. VP6: starts with FLV's own bytes, which say how to crop the picture.
 */
struct Frame {
    Stream stream = Stream::any; /**< video or audio */
    Milliseconds time{};         /**< when to decode it, counted from the file's first timestamp; may be negative */
    Bytes data;                  /**< valid until the next call on the file other than info() */
    Milliseconds composition_offset{}; /**< presentation time minus `time`, may be negative; 0 unless AVC */
    bool keyframe = false;             /**< can be decoded without earlier frames; true for all audio frames */
    int64_t position = -1;             /**< file position of its tag header; -1 if the host's tell failed */
    Bytes new_config; /**< the stream's configuration, if it has changed since the frame before; otherwise
                           empty. Valid as long as `data`. */

    Milliseconds presentation_time() const { return time + composition_offset; } /**< when to present it */
    bool config_changed() const { return !new_config.empty(); } /**< true: pass `new_config` to the decoder first */
};

/** The video stream. Fields that are not known are 0. */
struct VideoInfo {
    VideoCodec codec = VideoCodec::unknown; /**< of its frames */
    uint32_t width = 0;                     /**< pixels; wrong for AVC profiles after High 4:2:2, as is the height */
    uint32_t height = 0;                    /**< pixels */
    double frame_rate = 0.0;                /**< frames per second, from the metadata */
    std::string fourcc;                     /**< as in flvd_video_info_t, empty for an unknown codec */
    std::vector<uint8_t> config;            /**< AVC: the first AVCDecoderConfigurationRecord (ISO/IEC 14496-15) */
    Milliseconds last_keyframe{};           /**< file timestamp, from the index or the metadata */
};

/**
 * The audio stream. Fields that are not known are 0. For AAC and MP3, sample rate, sample size and channels come from
 * the codec's own data. For other codecs they come from the tag header, which can only express 5.5, 11, 22 and 44.1 kHz
 * and may be wrong: Speex always has 16 kHz and one channel; A-law, mu-law and Nellymoser usually have 8 or 16 kHz.
 */
struct AudioInfo {
    AudioCodec codec = AudioCodec::unknown; /**< of its frames */
    uint32_t sample_rate = 0;               /**< Hz */
    uint32_t sample_size = 0;               /**< bits */
    uint32_t channels = 0;                  /**< number of channels */
    uint32_t format_tag = 0;                /**< FLVD_AUDIO_TAG_*; 0 for other formats */
    uint32_t data_rate = 0;                 /**< kbit/s */
    std::vector<uint8_t> config;            /**< AAC: the first AudioSpecificConfig (ISO/IEC 14496-3) */
};

/** How seeking works in a file. */
enum class SeekMethod : uint32_t {
    none = FLVD_SEEK_NONE,         /**< not at all */
    by_index = FLVD_SEEK_BY_INDEX, /**< by the metadata's keyframe index */
    by_scan = FLVD_SEEK_BY_SCAN    /**< by scanning from tag to tag */
};

/** What was found out about a file when it was opened. A copy: it does not change. */
struct Info {
    std::string path;          /**< as given to open() */
    Milliseconds start_time{}; /**< first timestamp of the file, from which all times are counted; 0 for a
                                    growing file */
    Milliseconds duration{};   /**< last timestamp minus the first; 0 if unknown, as for a growing file */
    int64_t size = 0;          /**< bytes, 0 for a growing file */
    SeekMethod seek_method = SeekMethod::none; /**< how seeking works */
    std::optional<VideoInfo> video;            /**< the video stream, if there is one */
    std::optional<AudioInfo> audio;            /**< the audio stream, if there is one */
};

/** An entry of File::keyframes(). */
struct Keyframe {
    Milliseconds time{};  /**< counted from the file's first timestamp */
    int64_t position = 0; /**< file position of its tag header */
};

/* -------------------------------------------------------------------------------- how it is opened */

/** How a file is opened. */
struct Options {
    uint32_t cache_size = 0;            /**< size of each reader's cache in bytes; 0: default */
    uint32_t scan_read_size = 0;        /**< bytes per read while scanning; 0: default */
    bool separate_audio_reader = false; /**< request audio and video independently, each at its own pace */
    bool growing = false;               /**< the file may still be growing: see File::follow() */
    bool index_in_memory = false;       /**< keep the keyframe index in memory, for faster seeks */
    bool for_info_only = false; /**< open faster, but refuse frames and seeks; the duration may be the one that the
                                     metadata claims, and the seek method is not determined */
    uint8_t* buffer = nullptr;  /**< the caller's frame buffer, which must outlive the file; frames that do not fit
                                     are skipped. Null: the library's own, which grows as needed. */
    uint32_t buffer_size = 0;   /**< size of `buffer` in bytes */
    bool restarting_timestamps = false; /**< deliver all frames, even those later than the file's last timestamp, as in
                                             recordings whose timestamps restart; times may jump back, and seeks
                                             are refused */
};

/** How to seek. Combine modes with |. */
enum class SeekMode : uint32_t {
    automatic = 0,                 /**< backward when the time is earlier than the current position, else forward */
    absolute = 0,                  /**< the time is counted from the file's first timestamp */
    backward = FLVD_SEEK_BACKWARD, /**< to the keyframe at or before the time */
    forward = FLVD_SEEK_FORWARD,   /**< to the keyframe at or after the time */
    relative = FLVD_SEEK_RELATIVE, /**< the time is relative to the current position */
    to_end_on_miss = FLVD_SEEK_TO_END_ON_MISS, /**< go to the end after a miss */
    retry_backward = FLVD_SEEK_RETRY_BACKWARD  /**< after a miss, retry backward, with an absolute time */
};

/** Combines two modes. */
constexpr SeekMode operator|(SeekMode a, SeekMode b)
{
    return static_cast<SeekMode>(static_cast<uint32_t>(a) | static_cast<uint32_t>(b));
}

/** True if `modes` contains `mode`. */
constexpr bool has_mode(SeekMode modes, SeekMode mode)
{
    return (static_cast<uint32_t>(modes) & static_cast<uint32_t>(mode)) != 0;
}

/* ----------------------------------------------------------------------------------------- the file */

class FrameRange;

/** An open file. Can be moved, not copied. Closed by the destructor. */
class File {
public:
    /** A File that is not open. */
    File() = default;

    /**
     * Opens a file with the functions of `host`, which become the functions of the process, see above. Copies the path.
     * @return the file. Kind::not_yet if a growing file does not contain a file header and the start of a stream yet; a
     *         growing file that is not FLV looks the same, so set a time limit. Otherwise Kind::failed: with errno if
     *         the host could not open the file (EINVAL for a path that contains a null character), or with
     *         FLVD_ERR_HOST_IN_USE or FLVD_ERR_HOST_INCOMPLETE.
     * @note A stream that was not found is never found later. If info() lacks a stream that you expect of a growing
     *       file, open the file again later.
     */
    static result<File> open(std::string_view path, const Host& host, const Options& options = {})
    {
        File file;
        if (path.find('\0') != std::string_view::npos)
            return error(Kind::failed, FLVD_ERR_OPEN_MAIN, 0, EINVAL);
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

    /** The same. Null, which flvd_callback_host_add returns if a callback is missing, fails like a missing file. */
    static result<File> open(const char* path, const Host& host, const Options& options = {})
    {
        return open(path != nullptr ? std::string_view(path) : std::string_view(), host, options);
    }

    /** Opens a file with the stdio host. */
    static result<File> open(std::string_view path, const Options& options = {})
    {
        return open(path, make_host(flvd_stdio_host_fill), options);
    }

    /** The same. */
    static result<File> open(const char* path, const Options& options = {})
    {
        return open(path, make_host(flvd_stdio_host_fill), options);
    }

    /** Takes over the open file. */
    File(File&& other) noexcept { swap(other); }
    /** Closes this file and takes over the other one. */
    File& operator=(File&& other) noexcept
    {
        File taken(std::move(other));
        swap(taken);
        return *this;
    }
    File(const File&) = delete;
    File& operator=(const File&) = delete;
    ~File() { close(); } /**< closes the file */

    /** Closes the file. The data of its frames becomes invalid. */
    void close()
    {
        if (m_instance == nullptr)
            return;
        const std::lock_guard<std::recursive_mutex> lock(open_mutex);
        QVX_FLV_DMX(FLVD_OP_CLOSE, &m_instance, nullptr, nullptr);
        m_instance = nullptr;
        m_return = {};
        --m_open_files;
    }

    bool is_open() const { return m_instance != nullptr; } /**< false if closed or moved from */

    /** The instance of the C interface, for functions that have no wrapper here; null if not open. */
    flvd_ctx_t* instance() const { return m_instance; }

    /** Describes the file; empty if not open. */
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
     * Reads the script data at the beginning of the file: the first MiB of each script tag among the first 102 tags.
     * Does not change the playing position.
     * @return the properties, possibly none; Kind::failed
     */
    result<Metadata> metadata()
    {
        if (const error failed = leave(); failed.kind() != Kind::none)
            return failed;
        Metadata metadata;
        const int32_t code = read_script_tags(m_return.reader, metadata);
        go_back();
        if (is_failure(code))
            return error(Kind::failed, code, 0);
        return metadata;
    }

    /**
     * Lists the video keyframes, of a growing file those written so far. If seeking uses the keyframe index of the
     * file, the list comes from the index; otherwise the whole file is scanned, tag by tag. Does not change the playing
     * position.
     *
     * @param progress bool(int64_t reached, int64_t size): called after each keyframe of a scan with its position and
     *                 the size of the file (0 for a growing file); return false to end the list there. During the call
     *                 this File is not open, and it must not be destroyed.
     * @return the keyframes in file order, none without video; Kind::failed
     */
    template <typename Progress> result<std::vector<Keyframe>> keyframes(Progress&& progress)
    {
        File file(std::move(*this));
        const GiveBack give_back(*this, file);
        return file.list_keyframes(progress);
    }

    /** The same without progress reports. */
    result<std::vector<Keyframe>> keyframes()
    {
        return keyframes([](int64_t, int64_t) { return true; });
    }

    /**
     * Visits the valid tags of the file in order, script data and codec configurations included: of a growing file
     * those written so far. Crosses damage. Does not change the playing position.
     *
     * @param see bool(const Tag&): called for each tag; return false to end the visit. It must not use this File.
     * @return Kind::none; Kind::failed
     */
    template <typename See> error for_each_tag(See&& see)
    {
        if (const error failed = leave(); failed.kind() != Kind::none)
            return failed;
        const int32_t code = walk(m_return.reader, m_instance->data_offset, std::numeric_limits<int64_t>::max(),
                                  FLVD_TAG_VIDEO | FLVD_TAG_AUDIO | FLVD_TAG_SCRIPT, see);
        go_back();
        return is_failure(code) ? error(Kind::failed, code, 0) : error();
    }

    /**
     * Returns the next frame, as flvd_next_frame() does: it crosses damage of any length.
     *
     * When the codec configuration of a stream changes, the first frame after the change reports the new one. A seek
     * back before the change reports the old one again. A seek forward does not examine the tags that it skips, so a
     * change among them is not known until playing has passed it. Configurations above 64 KiB are not reported. If a
     * stream changes more than 256 times, earlier changes are forgotten, and a seek back to them reports nothing.
     *
     * @param stream video or audio, with a separate audio reader; ignored without one
     * @return the frame; Kind::end, or Kind::not_yet for a growing file; Kind::failed
     */
    result<Frame> next_frame(Stream stream = Stream::any)
    {
        result<Frame> frame{Frame()};
        if (!take(stream, *frame))
            return failure();
        return frame;
    }

    /**
     * Returns the next frame in memory that the caller provides, to be passed on without a copy. For files opened with
     * Options::buffer and without a separate audio reader. A frame whose size is not known in advance, such as the one
     * after damage or after a configuration, is written to that buffer instead.
     *
     * @param allocate uint8_t*(uint32_t size): memory for a frame of `size` bytes, or null; called at most once
     * @return as next_frame(); the data is either where `allocate` said or in Options::buffer
     */
    template <typename Allocate> result<Frame> next_frame_into(Allocate&& allocate)
    {
        if (!can_read())
            return failure();
        fio_file_t* const reader = m_instance->main_reader;
        Learned& learned = learned_of(reader);
        const int64_t begin = learned.is_position ? learned.end : find_position(reader, learned);
        const Tag ahead = peek_tag(reader, begin);
        const uint32_t size = ahead.end() <= m_instance->data_end ? ahead.frame_size() : 0;
        uint8_t* const memory = size != 0 ? allocate(size) : nullptr;
        if (memory == nullptr)
            return next_frame();
        const int64_t learned_end = learned.end;
        const auto video_config = m_video_configs.given();
        const auto audio_config = m_audio_configs.given();
        const flvd_frame_request_t request = std::exchange(m_request, {memory, size, 0});
        result<Frame> frame = next_frame();
        m_request = request;
        if (frame && frame->position == begin)
            return frame;
        // There was no valid tag ahead, and a frame that does not fit the memory may have been skipped.
        m_return = {reader, begin};
        learned = {learned_end, false};
        m_video_configs.give(video_config);
        m_audio_configs.give(audio_config);
        return next_frame();
    }

    /**
     * Checks whether there is damage between two frames. Does not change the playing position.
     *
     * @param from file position after a tag and its back-pointer
     * @param to   later file position of a tag header
     * @return true if there is nothing but valid tags between them
     */
    bool has_whole_tags(int64_t from, int64_t to)
    {
        if (leave().kind() != Kind::none)
            return false;
        int64_t reached = from;
        walk(m_return.reader, from, to, FLVD_TAG_VIDEO | FLVD_TAG_AUDIO | FLVD_TAG_SCRIPT, [&](const Tag& tag) {
            const bool follows = tag.position == reached;
            reached = follows ? tag.end() : reached;
            return follows;
        });
        go_back();
        return reached == to;
    }

    /**
     * Returns the next frame of a growing file. While there is none yet, calls `wait` and retries. After `wait` returns
     * false, because writing has stopped, retries once more.
     *
     * @param wait   bool(): sleeps for a while; returns true if the file may grow further
     * @param stream as for next_frame()
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

    /**
     * Delivers all frames from now on, as if the file had been opened with Options::restarting_timestamps, and refuses
     * seeks. No effect if nothing is open.
     */
    void accept_all_times()
    {
        if (m_instance == nullptr)
            return;
        m_instance->last_ts = 0; // no ceiling: all timestamps are valid; a seek would take it for the end of the file
        m_instance->seek_method = FLVD_SEEK_NONE;
    }

    /** The remaining frames, for range-for. Ends at the first request that fails; last_error() says why. */
    inline FrameRange frames(Stream stream = Stream::any) &;

    /**
     * Seeks to a keyframe, or to an audio frame if there is no video. After a miss or a failure playing continues where
     * it was, unless the mode says to go to the end.
     *
     * Time 0 and all earlier times lead to the first tag, whatever its time. With a keyframe index, "at or before"
     * refers to the times in the index, which muxers round or count from another start: the frame reached can be a few
     * milliseconds later. Seeking in a growing file needs video, a keyframe index in the metadata, and timestamps
     * that start at 0.
     *
     * @param time from the file's first timestamp, or with SeekMode::relative from the current position; clamped to 32
     * bits
     * @param mode how to get there
     * @return the time reached, from the file's first timestamp; Kind::miss; Kind::failed
     */
    result<Milliseconds> seek(Milliseconds time, SeekMode mode = SeekMode::automatic)
    {
        if (!can_read())
            return failure();
        for (Learned& learned : m_learned)
            learned.is_position = false;
        // The library goes to the first tag for file timestamps of 0 or less.
        const bool rewinds = !has_mode(mode, SeekMode::relative) && time.count() <= 0;
        const int64_t target = rewinds ? -int64_t{m_instance->first_ts} : time.count();
        const flvd_seek_request_t request = {clamp<int32_t>(target), static_cast<uint32_t>(mode)};
        int32_t reached = 0;
        if (QVX_FLV_DMX(FLVD_OP_SEEK, &m_instance, &request, &reached) != 0)
            return failure();
        m_learned = {};
        m_video_configs.jump();
        m_audio_configs.jump();
        return Milliseconds(reached);
    }

    /** Seeks by scanning from tag to tag from now on: for a file whose keyframe index turns out to be wrong. */
    void ignore_index()
    {
        if (m_instance != nullptr && m_instance->seek_method == FLVD_SEEK_BY_INDEX)
            m_instance->seek_method = FLVD_SEEK_BY_SCAN;
    }

    /**
     * Continues at a tag, from now on as with Options::restarting_timestamps: for a file whose timestamps turn out to
     * restart. For files without a separate audio reader.
     *
     * @param position file position of a tag header before which all frames have been delivered
     */
    void accept_restart(int64_t position)
    {
        if (m_instance == nullptr)
            return;
        accept_all_times();
        m_return = {m_instance->main_reader, position};
        m_learned[0] = {position, false};
    }

    /** File position at which the next request starts to read; -1 if the host's tell fails or nothing is open. */
    int64_t position() const
    {
        if (m_return.reader != nullptr)
            return m_return.position;
        return m_instance != nullptr ? __FLV_DMX__fioTell64(m_instance->main_reader) : -1;
    }

    /** The last failure of a frame request or a seek; Kind::none if there was none. Successes do not reset it. */
    error last_error() const { return failure(); }

private:
    friend FrameRange; // takes frames without a copy

    static constexpr int64_t smallest_tag_size = Tag::header_size + 1 + Tag::back_pointer_size; // of a frame
    static constexpr int64_t search_range = 1 << 20;      // bytes after which a search gives up
    static constexpr uint32_t metadata_tags = 102;        // an open examines the same number
    static constexpr uint32_t script_data_max = 1u << 20; // bytes read from one script tag
    static constexpr uint32_t config_max = 1u << 16;      // bytes; longer configurations are not reported
    static constexpr size_t configs_max = 256;            // remembered per stream

    // Where the configuration of a stream is known to change, and which one the decoder has. Empty until the first
    // change: up to then the one found by the open holds everywhere.
    class ConfigHistory {
    public:
        using Config = std::shared_ptr<const std::vector<uint8_t>>; // shared: the decoder's may be forgotten here

        ConfigHistory() = default;
        explicit ConfigHistory(Bytes opened) : m_given(share({opened.begin(), opened.end()})) {}

        bool empty() const { return m_changes.empty(); }

        // Notes that tags may have been skipped before the next configuration.
        void jump() { m_jumped = true; }

        // Adds a configuration whose tag starts at `position`. A repetition matters only after a jump: there may be
        // changes before it that are found later. If there is no room, forgets all others.
        void add(int64_t position, std::vector<uint8_t> bytes)
        {
            const bool jumped = std::exchange(m_jumped, false);
            if (empty()) {
                if (*m_given == bytes && !jumped)
                    return;
                m_changes.push_back({-1, m_given});
            }
            const auto next = after(position);
            const bool repeats = next != m_changes.begin() && *(next - 1)->config == bytes;
            if (repeats && (!jumped || (next - 1)->position == position))
                return;
            Change change = {position, share(std::move(bytes))};
            if (m_changes.size() == configs_max)
                m_changes.clear();
            m_changes.insert(after(position), std::move(change));
        }

        // The decoder's configuration.
        const Config& given() const { return m_given; }
        void give(const Config& config) { m_given = config; }

        // Returns the configuration of the frame whose tag starts at `position` if the decoder has another one.
        Bytes take_changed(int64_t position)
        {
            const auto next = after(position);
            if (position < 0 || next == m_changes.begin() || *(next - 1)->config == *m_given)
                return {};
            m_given = (next - 1)->config;
            return *m_given;
        }

    private:
        struct Change {
            int64_t position;
            Config config;
        };

        static Config share(std::vector<uint8_t> bytes)
        {
            return std::make_shared<const std::vector<uint8_t>>(std::move(bytes));
        }

        // The first change after a position.
        std::vector<Change>::iterator after(int64_t position)
        {
            const auto is_before = [](int64_t at, const Change& change) { return at < change.position; };
            return std::upper_bound(m_changes.begin(), m_changes.end(), position, is_before);
        }

        std::vector<Change> m_changes; // in file order
        Config m_given;
        bool m_jumped = false;
    };

    // How far a reader's tags have been searched for configurations since the last seek; -1: not at all.
    struct Learned {
        int64_t end = -1;
        bool is_position = false; // the reader stands at `end`
    };

    // Moves a file back to where it was moved from.
    class GiveBack {
    public:
        GiveBack(File& owner, File& file) : m_owner(owner), m_file(file) {}
        ~GiveBack() { m_owner = std::move(m_file); }
        GiveBack(const GiveBack&) = delete;
        GiveBack& operator=(const GiveBack&) = delete;

    private:
        File& m_owner;
        File& m_file;
    };

    // The playing position of a reader that is used for something else, or that could not be moved back.
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
        std::swap(m_learned, other.m_learned);
        std::swap(m_video_configs, other.m_video_configs);
        std::swap(m_audio_configs, other.m_audio_configs);
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
        m_video_configs = ConfigHistory({m_instance->video_info.config, m_instance->video_info.config_size});
        m_audio_configs = ConfigHistory({m_instance->audio_info.config, m_instance->audio_info.config_size});
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

    // False if nothing is open or a reader cannot be moved to its playing position.
    bool can_read()
    {
        if (m_return.reader != nullptr)
            go_back();
        return m_instance != nullptr && m_return.reader == nullptr;
    }

    // Saves the playing position of the main reader, which is going to be used for something else.
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

    // The tag at the reader's position `at`. No tag if fewer bytes are left than the smallest one has.
    static Tag peek_tag(fio_file_t* reader, int64_t at)
    {
        const uint8_t* bytes = reader->cache + reader->head; // when it is cached, no call is needed
        const bool cached = reader->count >= Tag::bytes_used;
        if (!cached && __FLV_DMX__fioShowBytesByPtr(&bytes, Tag::bytes_used, reader) < Tag::bytes_used)
            return {};
        return {at, {bytes, Tag::bytes_used}};
    }

    // The first wanted tag at or after the reader's position, by the library's own rules. No tag if there is none or if
    // its position is not known.
    Tag find_tag(fio_file_t* reader, uint32_t wanted) const
    {
        flvd_tag_info_t info;
        const bool found = FLVD_GetCurrTagInfo(m_instance, reader, &info, wanted, is_growing() ? 0 : 1) == 0;
        return found ? peek_tag(reader, __FLV_DMX__fioTell64(reader)) : Tag();
    }

    // Calls `see` for each wanted tag between two file positions, until it returns false. Crosses damage. Returns 0,
    // FLVD_ERR_SHORT_DATA if the data ends before `end`, and FLVD_ERR_SEEK or FLVD_ERR_POSITION if the host fails.
    template <typename See>
    int32_t walk(fio_file_t* reader, int64_t from, int64_t end, uint32_t wanted, See&& see) const
    {
        for (bool again = false; from < end;) {
            if (!move_to(reader, from))
                return FLVD_ERR_SEEK;
            flvd_tag_info_t info;
            const int32_t result = FLVD_GetCurrTagInfo(m_instance, reader, &info, wanted, is_growing() ? 0 : 1);
            const int64_t position = __FLV_DMX__fioTell64(reader);
            // Nothing found: the search gave up after its range, or a host call failed. A retry tells them apart.
            const bool found = result != FLVD_ERR_NOT_FOUND;
            if (position < 0 || (!found && again && position <= from))
                return FLVD_ERR_POSITION;
            if (!found) {
                again = !again && position - from < search_range;
                from = again ? from : position;
                continue;
            }
            const Tag tag = peek_tag(reader, position);
            if (result != 0 || tag.position < 0)
                return end - position < smallest_tag_size ? FLVD_ERR_NONE : FLVD_ERR_SHORT_DATA;
            if (position >= end || !see(tag))
                return FLVD_ERR_NONE;
            from = tag.end();
            again = false;
        }
        return FLVD_ERR_NONE;
    }

    static bool is_failure(int32_t code) { return code != FLVD_ERR_NONE && code != FLVD_ERR_SHORT_DATA; }

    /* Frames. */

    // Gets the next frame. False if there is none.
    bool take(Stream stream, Frame& frame)
    {
        if (!can_read())
            return false;
        fio_file_t* const reader = stream == Stream::audio ? m_instance->audio_reader : m_instance->main_reader;
        Learned& learned = learned_of(reader);
        const int64_t begin = learned.is_position ? learned.end : find_position(reader, learned);
        learned.is_position = false;
        Tag ahead = peek_tag(reader, begin);
        if (has_two_readers() && !go_to_stream(reader, stream, ahead))
            return false;
        m_request.stream = static_cast<uint32_t>(stream);
        flvd_frame_t taken;
        if (request(taken) != 0)
            return false;
        const int64_t end = __FLV_DMX__fioTell64(reader);
        frame.stream = static_cast<Stream>(taken.stream);
        frame.time = time_of(taken.timestamp_ms + m_instance->first_ts);
        frame.data = {taken.data, taken.size};
        const uint32_t payload = taken.size + codec_header_size(frame.stream);
        if (!ahead.has_payload(frame.stream, payload, end) || ahead.position != learned.end)
            ahead = look_again(taken, reader, begin, end);
        else
            learned = {end, true};
        frame.composition_offset = Milliseconds(ahead.composition_offset());
        frame.keyframe = frame.stream == Stream::audio || ahead.is_keyframe();
        frame.position = ahead.position;
        ConfigHistory& configs = configs_of(frame.stream);
        frame.new_config = configs.empty() || learned.end != end ? Bytes() : configs.take_changed(ahead.position);
        return true;
    }

    bool has_two_readers() const { return m_instance->main_reader != m_instance->audio_reader; }

    Learned& learned_of(const fio_file_t* reader) { return m_learned[reader == m_instance->main_reader ? 0 : 1]; }

    // Where a reader stands; -1 if the host's tell fails. After a seek, the search for configurations starts there.
    static int64_t find_position(fio_file_t* reader, Learned& learned)
    {
        const int64_t position = std::max<int64_t>(__FLV_DMX__fioTell64(reader), -1);
        if (learned.end < 0)
            learned.end = position;
        return position;
    }

    // Most requests deliver a frame. flvd_next_frame takes over only when one does not.
    int32_t request(flvd_frame_t& frame)
    {
        const int32_t result = QVX_FLV_DMX(FLVD_OP_GET_FRAME, &m_instance, &m_request, &frame);
        return result == FLVD_RET_END ? flvd_next_frame(m_instance, &m_request, &frame) : result;
    }

    // With two readers, moves past tags of the other stream, which the library would skip as well. False if the reader
    // could not be moved back when there was no tag.
    [[gnu::noinline]] bool go_to_stream(fio_file_t* reader, Stream stream, Tag& ahead)
    {
        const bool found = (m_instance->streams & static_cast<uint32_t>(stream)) != 0;
        if (!found || ahead.position < 0 || ahead.stream() == stream)
            return true;
        const Return begin = {reader, ahead.position};
        ahead = find_tag(reader, stream == Stream::video ? FLVD_TAG_VIDEO : FLVD_TAG_AUDIO);
        if (ahead.position >= 0) {
            Learned& learned = learned_of(reader);
            if (learned.end == begin.position)
                learned.end = ahead.position; // no tag of this stream was skipped
            return true;
        }
        m_return = begin;
        return can_read();
    }

    // Converts a file timestamp. Those before the file's first one become negative.
    Milliseconds time_of(uint32_t timestamp) const
    {
        return Milliseconds(int64_t{timestamp} - int64_t{m_instance->first_ts});
    }

    // For a frame that did not come from the tag ahead, or if an earlier request skipped tags: finds the frame's tag
    // and the configurations before it. `begin` and `end` are the reader's positions before and after the request.
    [[gnu::noinline]] Tag look_again(const flvd_frame_t& frame, fio_file_t* reader, int64_t begin, int64_t end)
    {
        if (end < 0)
            return {};
        // Allocating a configuration may throw. Then the next request delivers the frame again.
        m_return = {reader, begin < 0 ? end : begin};
        const Tag tag = tag_before(frame, reader, end);
        Learned& learned = learned_of(reader);
        if (learned.end < 0 || (tag.position >= 0 && learn_configs(reader, learned.end, tag)))
            learned.end = end; // else the host failed, and the next frame retries
        m_return.position = end;
        go_back();
        return tag;
    }

    // The tag that carries the frame and ends at `end`; none if the host failed.
    static Tag tag_before(const flvd_frame_t& frame, fio_file_t* reader, int64_t end)
    {
        for (const uint32_t codec_header : {5U, 2U, 1U}) {
            const uint32_t payload = frame.size + codec_header;
            const int64_t begin = end - Tag::back_pointer_size - payload - Tag::header_size;
            const Tag tag = begin >= 0 && move_to(reader, begin) ? peek_tag(reader, begin) : Tag();
            if (tag.codec_header_size() == codec_header &&
                tag.has_payload(static_cast<Stream>(frame.stream), payload, end))
                return tag;
        }
        return {};
    }

    // Size of the codec header before the frames of a stream that was found by the open.
    uint32_t codec_header_size(Stream stream) const
    {
        if (stream == Stream::video)
            return video_codec() == VideoCodec::avc ? 5 : 1;
        return audio_codec() == AudioCodec::aac ? 2 : 1;
    }

    // Adds the configurations before a tag to the history: those of both streams, or with two readers those of the
    // tag's stream, since the other reader may be elsewhere. False if the host failed.
    bool learn_configs(fio_file_t* reader, int64_t from, const Tag& last)
    {
        const uint32_t one = last.is_video() ? FLVD_TAG_VIDEO : FLVD_TAG_AUDIO;
        const uint32_t wanted = has_two_readers() ? one : FLVD_TAG_VIDEO | FLVD_TAG_AUDIO;
        bool learned = true;
        const int32_t code = walk(reader, from, last.position, wanted, [&](const Tag& tag) {
            learned = !tag.is_config() || learn_config(reader, tag);
            return learned;
        });
        return learned && code == FLVD_ERR_NONE;
    }

    bool learn_config(fio_file_t* reader, const Tag& tag)
    {
        const uint32_t headers = tag.codec_header_size();
        if (tag.data_size() <= headers || tag.data_size() - headers > config_max)
            return true;
        std::vector<uint8_t> config(tag.data_size() - headers);
        const auto size = static_cast<uint32_t>(config.size());
        __FLV_DMX__fioSkipBytes(Tag::header_size + headers, reader);
        if (__FLV_DMX__fioRead(config.data(), 1, size, reader) != size)
            return false;
        configs_of(tag.stream()).add(tag.position, std::move(config));
        return true;
    }

    ConfigHistory& configs_of(Stream stream) { return stream == Stream::video ? m_video_configs : m_audio_configs; }

    /* Information about the file. */

    // CodecID is the low half of the codec byte, SoundFormat the high half.
    VideoCodec video_codec() const { return static_cast<VideoCodec>(m_instance->video_codec_filter & 15); }
    AudioCodec audio_codec() const { return static_cast<AudioCodec>(m_instance->audio_format_filter >> 4 & 15); }

    VideoInfo describe_video() const
    {
        const flvd_video_info_t& video = m_instance->video_info;
        VideoInfo info;
        info.codec = video_codec();
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
        info.codec = audio_codec();
        info.sample_rate = audio.sample_rate;
        info.sample_size = audio.sample_size;
        info.channels = audio.channels;
        info.format_tag = audio.format_tag;
        info.data_rate = audio.data_rate;
        info.config.assign(audio.config, audio.config + audio.config_size);
        return info;
    }

    // Returns the code of walk().
    int32_t read_script_tags(fio_file_t* reader, Metadata& metadata) const
    {
        uint32_t tags = 0;
        const uint32_t any = FLVD_TAG_VIDEO | FLVD_TAG_AUDIO | FLVD_TAG_SCRIPT;
        return walk(reader, m_instance->data_offset, std::numeric_limits<int64_t>::max(), any, [&](const Tag& tag) {
            if (tag.is_script())
                read_script_tag(reader, tag, metadata);
            return ++tags < metadata_tags;
        });
    }

    static void read_script_tag(fio_file_t* reader, const Tag& tag, Metadata& metadata)
    {
        std::vector<uint8_t> payload(std::min(tag.data_size(), script_data_max));
        __FLV_DMX__fioSkipBytes(Tag::header_size, reader);
        const uint32_t size = __FLV_DMX__fioRead(payload.data(), 1, static_cast<uint32_t>(payload.size()), reader);
        metadata.add_script_data({payload.data(), size});
    }

    // keyframes() on a file that `report` cannot reach.
    template <typename Report> result<std::vector<Keyframe>> list_keyframes(Report& report)
    {
        if (const error failed = leave(); failed.kind() != Kind::none)
            return failed;
        std::vector<Keyframe> list;
        int32_t code = FLVD_ERR_NONE;
        if ((m_instance->streams & FLVD_STREAM_VIDEO) != 0) {
            if (m_instance->seek_method == FLVD_SEEK_BY_INDEX)
                list = read_index(m_return.reader);
            if (list.empty())
                code = walk_keyframes(m_return.reader, report, list);
        }
        go_back();
        if (is_failure(code) || (code != FLVD_ERR_NONE && !is_growing())) // a read failed
            return error(Kind::failed, code, 0);
        return list;
    }

    // Adds all keyframes found by scanning the file. Returns the code of walk().
    template <typename Report>
    int32_t walk_keyframes(fio_file_t* reader, Report& report, std::vector<Keyframe>& list) const
    {
        const int64_t end = is_growing() ? std::numeric_limits<int64_t>::max() : m_instance->data_end;
        return walk(reader, m_instance->data_offset, end, FLVD_TAG_VIDEO | FLVD_TAG_KEYFRAME, [&](const Tag& tag) {
            if (!tag.has_frame())
                return true;
            list.push_back({time_of(tag.timestamp()), tag.position});
            return static_cast<bool>(report(tag.position, m_instance->file_size));
        });
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

    // Reads up to `count` elements of an AMF0 strict array. Stops at a value that is not a number.
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

    // Clamps to the range of To. NaN becomes the least value.
    template <typename To, typename From> static To clamp(From value)
    {
        using Limits = std::numeric_limits<To>;
        if (value >= static_cast<From>(Limits::max()))
            return Limits::max();
        return value > static_cast<From>(Limits::min()) ? static_cast<To>(value) : Limits::min();
    }

    inline static Host m_host = make_host(nullptr); // of all open files; both guarded by open_mutex
    inline static size_t m_open_files = 0;

    std::unique_ptr<char[]> m_path; // the library keeps a pointer to it
    flvd_ctx_t* m_instance = nullptr;
    flvd_frame_request_t m_request{};
    Return m_return;
    std::array<Learned, 2> m_learned; // main reader, separate audio reader
    ConfigHistory m_video_configs;
    ConfigHistory m_audio_configs;
};

/** The frames of a file from where it stands, for one range-for. */
class FrameRange {
public:
    /** The end of the range. */
    struct Sentinel {};

    /** A position in the range. All iterators of a range share it. */
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
