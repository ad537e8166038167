/*
 * flvdmx: a demultiplexer for the FLV container.
 *
 * The host fills an flvd_init_t with its memory and file functions and a file name, then drives the library
 * through one entry point, QVX_FLV_DMX: open, get frames, seek, close. The library finds the streams and their
 * codec configuration, parses the metadata and delivers one audio or video frame per call. It does not decode.
 *
 * Self-contained, for C11 and C++17. All sizes are in bytes and all times in milliseconds unless stated
 * otherwise. Multi-byte fields of an FLV file are big-endian (FLV file format, version 10.1, annex E).
 *
 * THE HOST'S FUNCTIONS
 *
 * The library never allocates memory or accesses a file directly: it always calls the functions in flvd_init_t.
 * Their contract:
 *
 * - When they are called. Only during a call to QVX_FLV_DMX or to another function of this header, on the
 *   caller's thread. They must not call back into the library.
 * - Which may be null. `file_seek64` and `file_tell64`; the library then uses the 32-bit functions and cannot
 *   reach positions beyond 2 GiB. `mem_slot1`, `mem_slot3` and `mem_slot5` are copied but never called, and the
 *   unused words are never read, so these may hold anything. All other functions are called without a null check.
 * - Memory. `mem_alloc` returns memory aligned for any type, or null when there is none; the library reports
 *   that as an error. `mem_free` must accept null. `mem_copy` is never called for 0 bytes, and its ranges never
 *   overlap. An open allocates the instance, one reader with its cache (two with FLVD_OPT_SEPARATE_AUDIO_READER),
 *   a frame buffer of 512,000 bytes unless FLVD_OPT_USER_BUFFER is set, and whatever the file's codec
 *   configurations and keyframe arrays need. A frame request allocates only when the frame does not fit the buffer.
 * - Reading. `file_read` is called with an element size of 1 and returns the number of bytes read. A short read
 *   means the end of the data, so the function must fill the request unless it reaches the end: where a system
 *   call may return early, loop. The library does not retry, and a read error looks like the end.
 * - Seeking and telling. `whence` is 0 for the start, 1 for the current position, 2 for the end; a seek returns 0
 *   on success. A tell returns a negative value on failure. Seeking past the end of the file must succeed, as it
 *   does with fseek, and a successful seek must clear the state that `file_eof` reports.
 * - Context. The memory functions and `file_open` take no context argument, so there is one set of functions per
 *   process: every open overwrites the process-wide tables, and instances that are already open use the new
 *   functions from then on. Pass the same functions to every open.
 * - Threads. The library starts no threads and takes no locks. No other call may run during an open or during a
 *   call without an instance; apart from that, calls on different instances may run concurrently. An instance
 *   may be used by only one thread at a time. FLVD_ParseVideoHeader counts as an open, because its AVC parser is
 *   shared by the whole process.
 */
#ifndef FLVDMX_FLVDMX_H
#define FLVDMX_FLVDMX_H

#include <stddef.h>
#include <stdint.h>

#ifdef __cplusplus
extern "C" {
#endif

#if defined(__GNUC__)
#define FLVD_API __attribute__((visibility("default")))
#else
#define FLVD_API
#endif

/* ------------------------------------------------------------------------------- codes and bits */

/** Operation codes of QVX_FLV_DMX. */
enum {
    FLVD_OP_OPEN = 0,           /**< open a file: flvd_init_t, flvd_open_info_t */
    FLVD_OP_CLOSE = 1,          /**< close an instance: both arguments unused */
    FLVD_OP_GET_FRAME = 2,      /**< next frame: flvd_frame_request_t, flvd_frame_t */
    FLVD_OP_SEEK = 3,           /**< time seek: flvd_seek_request_t, int32_t */
    FLVD_OP_RESERVED = 4,       /**< always fails */
    FLVD_OP_GET_LAST_ERROR = 5, /**< get the last error code: both arguments unused */
    FLVD_OP_OPEN_INFO = 10      /**< like FLVD_OP_OPEN, for information only: frame requests and seeks fail */
};

/** What a failed QVX_FLV_DMX returns. FLVD_OP_GET_LAST_ERROR returns the detailed error code. */
enum {
    FLVD_RET_FAILED = -1,      /**< general failure */
    FLVD_RET_END = -2,         /**< end of the data, read error, or a seek that missed; see QVX_FLV_DMX */
    FLVD_RET_NO_INSTANCE = -3, /**< the handle holds no instance */
    FLVD_RET_CANNOT_OPEN = -4  /**< the file cannot be opened */
};

/** Option bits of flvd_init_t::options; other bits are ignored. */
enum {
    FLVD_OPT_SEPARATE_AUDIO_READER = 0x1, /**< read audio through a second reader; ignored by FLVD_OP_OPEN_INFO */
    FLVD_OPT_USER_BUFFER = 0x2,           /**< each frame request supplies its own buffer */
    FLVD_OPT_PROGRESSIVE = 0x4,           /**< the file may still be growing */
    FLVD_OPT_INDEX_IN_MEMORY = 0x8        /**< keep the metadata's keyframe index in memory */
};

/** Stream bits of flvd_ctx_t::streams; also the stream numbers of requests and frames. */
enum {
    FLVD_STREAM_VIDEO = 1, /**< video */
    FLVD_STREAM_AUDIO = 2  /**< audio */
};

/** Seek methods of flvd_file_info_t::seek_method. */
enum {
    FLVD_SEEK_NONE = 0,     /**< not seekable */
    FLVD_SEEK_BY_INDEX = 1, /**< through the metadata's keyframe index */
    FLVD_SEEK_BY_SCAN = 2   /**< by stepping from tag to tag */
};

/** Mode bits of flvd_seek_request_t::mode. */
enum {
    FLVD_SEEK_RELATIVE = 0x10,          /**< `time` counts from the current position */
    FLVD_SEEK_DIRECTION_MASK = 0x300,   /**< direction; 0 and 0x300: backward to an earlier target, else forward */
    FLVD_SEEK_BACKWARD = 0x100,         /**< land on the keyframe at or before the target */
    FLVD_SEEK_FORWARD = 0x200,          /**< land on the keyframe at or after the target */
    FLVD_SEEK_TO_END_ON_MISS = 0x10000, /**< after a miss, move the readers to the end of the file */
    FLVD_SEEK_RETRY_BACKWARD = 0x20000  /**< after a miss, retry once: an absolute backward seek to `time` */
};

/** Values of flvd_audio_info_t::format_tag: registered WAVE format tags, and the library's own for AAC. */
enum {
    FLVD_AUDIO_TAG_MPEG = 0x50, /**< MPEG audio layer 2; only set by FLVD_ParseAudioHeader */
    FLVD_AUDIO_TAG_MP3 = 0x55,  /**< MPEG audio layer 3 or 1, and every stream that FLV labels MP3 */
    FLVD_AUDIO_TAG_AAC = 0xAAC0 /**< AAC */
};

/** Error codes, recorded in flvd_ctx_t::error or in g_flvd_lLastError. */
enum {
    FLVD_ERR_NONE = 0,                  /**< none; also recorded for a frame that was skipped because it did not fit */
    FLVD_ERR_POSITION = -1,             /**< a host tell failed */
    FLVD_ERR_SEEK = -2,                 /**< a host seek failed */
    FLVD_ERR_NO_MEMORY = -3,            /**< no memory for a codec configuration, or the configuration is too short */
    FLVD_ERR_INSTANCE_MEMORY = -4,      /**< no memory for the instance */
    FLVD_ERR_OPEN_MAIN = -5,            /**< the main reader could not be opened */
    FLVD_ERR_OPEN_AUDIO = -6,           /**< the audio reader could not be opened */
    FLVD_ERR_FRAME_BUFFER = -7,         /**< no memory for the frame buffer */
    FLVD_ERR_NO_STREAM = -1002,         /**< neither a video nor an audio stream was found */
    FLVD_ERR_FILE_HEADER = -1004,       /**< no FLV file header, or an invalid one */
    FLVD_ERR_EXTENT = -1005,            /**< the end of the valid data was not found */
    FLVD_ERR_FRAME_SEEK = -2000,        /**< a frame seek failed */
    FLVD_ERR_SEEK_MISS = -2003,         /**< the target is beyond the end, or no keyframe is in that direction */
    FLVD_ERR_SEEK_PLACE = -2006,        /**< no tag, or an unexpected one, where a seek landed */
    FLVD_ERR_INDEX_ELEMENT = -2007,     /**< a keyframe position in the metadata is not a number */
    FLVD_ERR_AVC_CONFIG = -3001,        /**< AVC record: damaged, or its parameter sets are not 1 to 128 bytes */
    FLVD_ERR_VIDEO_HEADER = -3002,      /**< invalid picture header or sequence parameter set */
    FLVD_ERR_AUDIO_HEADER = -3003,      /**< no MPEG audio frame header */
    FLVD_ERR_AVC_NO_SEQ_HEADER = -3004, /**< the first AVC tag is not a sequence header */
    FLVD_ERR_NO_INSTANCE = -4001,       /**< the handle holds no instance */
    FLVD_ERR_NO_VIDEO = -4002,          /**< video was requested, but the file has none */
    FLVD_ERR_NO_AUDIO = -4003,          /**< audio was requested, but the file has none */
    FLVD_ERR_BAD_STREAM = -4004,        /**< the requested stream is neither video nor audio */
    FLVD_ERR_RESERVED_OP = -4006,       /**< operation 4 */
    FLVD_ERR_INFO_ONLY = -4007,         /**< the instance was opened for information only */
    FLVD_ERR_NO_TAG = -10001,           /**< no valid tag was found */
    FLVD_ERR_SHORT_DATA = -10002,       /**< end of the data, or a short read */
    FLVD_ERR_NOT_SEEKABLE = -10003      /**< not seekable; growing file: no video, or no keyframe index */
};

/* --------------------------------------------------------------------------- the host's functions */

typedef void* (*flvd_mem_alloc_fn)(uint32_t size);                                        /**< memory, or null */
typedef void (*flvd_mem_free_fn)(void* memory);                                           /**< accepts null */
typedef void* (*flvd_mem_copy_fn)(void* destination, const void* source, uint32_t count); /**< result ignored */
typedef void* (*flvd_mem_set_fn)(void* destination, int value, uint32_t count);           /**< result ignored */
typedef void (*flvd_mem_slot_fn)(void);                                                   /**< copied, never called */

typedef void* (*flvd_file_open_fn)(const char* path, const char* mode); /**< handle, or null */
typedef uint32_t (*flvd_file_read_fn)(void* buffer, uint32_t size, uint32_t count, void* handle); /**< bytes read */
typedef uint32_t (*flvd_file_write_fn)(const void* buffer, uint32_t size, uint32_t count,
                                       void* handle);                               /**< bytes written */
typedef int32_t (*flvd_file_seek_fn)(void* handle, int32_t offset, int32_t whence); /**< 0 on success */
typedef int32_t (*flvd_file_tell_fn)(void* handle);  /**< position, negative on failure */
typedef int32_t (*flvd_file_close_fn)(void* handle); /**< result passed on to the caller */
typedef int32_t (*flvd_file_eof_fn)(void* handle);   /**< non-zero at the end of the file */
typedef int32_t (*flvd_file_flush_fn)(void* handle); /**< result passed on to the caller */
typedef int32_t (*flvd_file_seek64_fn)(void* handle, int64_t offset, int32_t whence); /**< 0 on success */
typedef int64_t (*flvd_file_tell64_fn)(void* handle); /**< position, negative on failure */

/**
 * Initialisation block of operations 0 and 10: 36 pointer-sized words (word n is at offset n × pointer size). The
 * library reads it only during the call, but the string that `file_name` points to must live until close.
 */
typedef struct flvd_init_t {
    flvd_mem_alloc_fn mem_alloc;     /**< word 0 */
    flvd_mem_free_fn mem_free;       /**< word 1 */
    flvd_mem_slot_fn mem_slot3;      /**< word 2, never called */
    flvd_mem_copy_fn mem_copy;       /**< word 3 */
    flvd_mem_slot_fn mem_slot5;      /**< word 4, never called */
    flvd_mem_set_fn mem_set;         /**< word 5 */
    flvd_mem_slot_fn mem_slot1;      /**< word 6, never called */
    uintptr_t unused7[9];            /**< words 7 to 15, not read */
    flvd_file_open_fn file_open;     /**< word 16 */
    flvd_file_read_fn file_read;     /**< word 17 */
    flvd_file_seek_fn file_seek;     /**< word 18 */
    flvd_file_tell_fn file_tell;     /**< word 19 */
    flvd_file_close_fn file_close;   /**< word 20 */
    flvd_file_eof_fn file_eof;       /**< word 21 */
    flvd_file_flush_fn file_flush;   /**< word 22 */
    flvd_file_write_fn file_write;   /**< word 23 */
    uintptr_t unused24;              /**< word 24, not read */
    flvd_file_seek64_fn file_seek64; /**< word 25, may be null */
    flvd_file_tell64_fn file_tell64; /**< word 26, may be null */
    uintptr_t unused27[5];           /**< words 27 to 31, not read */
    const char* file_name;           /**< word 32: path, passed to file_open unchanged; must live until close */
    uintptr_t options;               /**< word 33: FLVD_OPT_* bits */
    uintptr_t cache_size;            /**< word 34: cache size of each reader; 0 means 4096, the least is 1024 */
    uintptr_t scan_read_size;        /**< word 35: bytes per read while scanning; 0 means 16, at most the cache size */
} flvd_init_t;

/* -------------------------------------------------------------------------------------- records */

typedef struct fio_file_t fio_file_t; /**< cached file, flvdmx/layers.h */

/** The file as a whole. Owned by the instance, valid until close. */
typedef struct flvd_file_info_t {
    const char* file_name; /**< the pointer passed to the open; owned by the host */
    uint32_t duration_ms;  /**< last timestamp minus first, 0 when unknown */
    int64_t file_size;     /**< bytes, 0 for a growing file */
    uint32_t seek_method;  /**< FLVD_SEEK_NONE, FLVD_SEEK_BY_INDEX or FLVD_SEEK_BY_SCAN */
} flvd_file_info_t;

/** The video stream. Owned by the instance, valid until close, `config` included. 0 where the file has no value. */
typedef struct flvd_video_info_t {
    uint32_t reserved;         /**< 0 */
    uint32_t width;            /**< pixels */
    uint32_t height;           /**< pixels */
    uint32_t frame_rate;       /**< thousandths of a frame per second, from metadata */
    char fourcc[4];            /**< "JPEG" "FLV1" "SCR1" "VP60" "VP6A" "SCR2" "H264"; zeros: unknown CodecID */
    uint8_t* config;           /**< AVC: AVCDecoderConfigurationRecord (ISO/IEC 14496-15), else null */
    uint32_t config_size;      /**< its bytes */
    uint32_t last_key_time_ms; /**< timestamp of the last keyframe in the file, ms, from the index or the metadata */
} flvd_video_info_t;

/** The audio stream. Owned by the instance, valid until close, `config` included. 0 where the file has no value. */
typedef struct flvd_audio_info_t {
    uint32_t reserved;    /**< 0 */
    uint32_t sample_rate; /**< Hz */
    uint32_t sample_size; /**< bits per sample */
    uint32_t channels;    /**< channel count */
    uint32_t format_tag;  /**< FLVD_AUDIO_TAG_*, 0 for every other sound format */
    uint8_t* config;      /**< AAC: AudioSpecificConfig (ISO/IEC 14496-3), else null */
    uint32_t config_size; /**< its bytes */
    uint32_t reserved2;   /**< 0 */
    uint32_t data_rate;   /**< kbit/s */
} flvd_audio_info_t;

/** Result of operations 0 and 10: seven pointer-sized words, valid after success and until close. */
typedef struct flvd_open_info_t {
    const flvd_file_info_t* file_info;     /**< the file */
    uintptr_t has_video;                   /**< 1 when a video stream was found */
    const flvd_video_info_t* video_info;   /**< the video stream, or null */
    const flvd_video_info_t* video_config; /**< the same pointer again */
    uintptr_t has_audio;                   /**< 1 when an audio stream was found */
    const flvd_audio_info_t* audio_info;   /**< the audio stream, or null */
    const flvd_audio_info_t* audio_config; /**< the same pointer again */
} flvd_open_info_t;

/** First argument of operation 2. A null buffer counts as a buffer of 0 bytes. */
typedef struct flvd_frame_request_t {
    uint8_t* buffer;      /**< with FLVD_OPT_USER_BUFFER: receives the frame; else ignored */
    uint32_t buffer_size; /**< its bytes */
    uint32_t stream;      /**< with FLVD_OPT_SEPARATE_AUDIO_READER: FLVD_STREAM_VIDEO or _AUDIO; else ignored */
} flvd_frame_request_t;

/**
 * Second argument of operation 2. Cleared first, except by a request that is refused (a code from
 * FLVD_ERR_INFO_ONLY to FLVD_ERR_NO_VIDEO). `data` is valid until the next request on the instance.
 */
typedef struct flvd_frame_t {
    uint8_t* data;         /**< payload without the FLV codec header bytes */
    uint32_t size;         /**< bytes */
    uint32_t stream;       /**< FLVD_STREAM_VIDEO or FLVD_STREAM_AUDIO */
    uint32_t timestamp_ms; /**< tag timestamp minus the first timestamp, modulo 2^32; decoding order */
    uint32_t reserved[2];  /**< 0 */
} flvd_frame_t;

/**
 * First argument of operation 3. The second is an int32_t that receives the time reached, in ms from the first
 * timestamp; it is written on success only. The current position is the time of the last video frame, or of the last
 * audio frame in a file without video. A target whose file timestamp is 0 or less goes to the first tag; a
 * relative time of 0 only reports the current position. A seek misses (FLVD_RET_END) when the target is beyond the end
 * or no keyframe is in its direction. After a miss or any other failure, delivery continues where it was.
 */
typedef struct flvd_seek_request_t {
    int32_t time;  /**< ms from the first timestamp, or from the current position with FLVD_SEEK_RELATIVE */
    uint32_t mode; /**< FLVD_SEEK_RELATIVE, _BACKWARD, _FORWARD, _TO_END_ON_MISS, _RETRY_BACKWARD */
} flvd_seek_request_t;

/** Keyframe index in the file: the AMF0 strict arrays of the metadata's "keyframes" object. */
typedef struct flvd_keyframe_index_t {
    int64_t times_offset;     /**< file position of the first element of "times", 0 when there is none */
    int64_t positions_offset; /**< file position of the first element of "filepositions", 0 when there is none */
    uint32_t entry_count;     /**< usable entries; 0xFFFFFFFF when "keyframes" held no array */
} flvd_keyframe_index_t;

/** Keyframe index in memory, kept with FLVD_OPT_PROGRESSIVE or FLVD_OPT_INDEX_IN_MEMORY; owned by the instance. */
typedef struct flvd_keyframe_arrays_t {
    uint32_t times_count;     /**< entries of times_ms */
    uint32_t* times_ms;       /**< ms, or null */
    uint32_t positions_count; /**< entries of positions */
    int64_t* positions;       /**< file positions, or null */
} flvd_keyframe_arrays_t;

/** Instance: one open file. Operations 0 and 10 create it, operation 1 frees it. A host may read it, never write it. */
typedef struct flvd_ctx_t {
    fio_file_t* cur_reader;               /**< reader used by probing: the main reader */
    fio_file_t* main_reader;              /**< reads video, and audio too unless that has a separate reader */
    fio_file_t* audio_reader;             /**< the separate audio reader, or else the main reader */
    uint32_t options;                     /**< FLVD_OPT_* */
    uint32_t seek_method;                 /**< FLVD_SEEK_NONE, _BY_INDEX, _BY_SCAN */
    uint32_t opened_for_info;             /**< 1 when opened with operation 10 */
    uint8_t* frame_buffer;                /**< frames are copied here */
    uint32_t frame_buffer_size;           /**< its capacity */
    uint32_t cache_size;                  /**< cache of each reader */
    uint32_t scan_read_size;              /**< read size while scanning */
    uint32_t byte_rate;                   /**< bytes per 1024 ms, 0 when unknown */
    uint32_t streams;                     /**< FLVD_STREAM_* bits: announced by the file header, later those found */
    flvd_file_info_t file_info;           /**< the records that flvd_open_info_t points to */
    flvd_video_info_t video_info;         /**< the same for video */
    flvd_audio_info_t audio_info;         /**< the same for audio */
    int64_t file_size;                    /**< bytes; INT64_MAX while a growing file is probed, then 0 */
    int64_t data_end;                     /**< end of the valid data; INT64_MAX for a growing file */
    int32_t data_offset;                  /**< DataOffset of the file header: position of PreviousTagSize0 */
    uint32_t last_frame_size;             /**< bytes of the last frame read */
    uint32_t last_video_ts;               /**< time of the last video frame, from first_ts */
    uint32_t last_audio_ts;               /**< time of the last audio frame, from first_ts */
    uint32_t duration_ms;                 /**< last_ts - first_ts */
    uint32_t first_ts;                    /**< smallest media timestamp seen while probing */
    uint32_t last_ts;                     /**< last timestamp of the file, the ceiling for tag headers; 0 until known */
    uint32_t audio_delay_ms;              /**< metadata "audiodelay" */
    uint32_t video_codec_filter;          /**< codec byte of the video tag that was probed; 0xFFFF: none */
    uint32_t audio_format_filter;         /**< codec byte of the audio tag that was probed; 0xFFFF: none */
    flvd_keyframe_index_t keyframe_index; /**< index in the file */
    int64_t last_keyframe_pos;            /**< metadata "lastkeyframelocation" */
    uint32_t last_keyframe_ms;            /**< metadata "lastkeyframetimestamp", or from the index */
    uint32_t file_shorter_than_meta;      /**< 1 when the metadata's "filesize" is larger than the file */
    int64_t saved_main_pos;               /**< position to restore after a failure, or 0 */
    int64_t saved_audio_pos;              /**< the same for the audio reader */
    flvd_keyframe_arrays_t keyframe_arrays; /**< index in memory */
    int32_t error;                          /**< last error code, FLVD_ERR_* */
    int32_t error_line;                     /**< line number that identifies the failure, the same in every release */
} flvd_ctx_t;

/* ---------------------------------------------------------------------------------- entry point */

/** Error code of the last failure without an instance: a failed open, or a call on a handle that holds none. */
FLVD_API extern int32_t g_flvd_lLastError;
/** Line number that goes with g_flvd_lLastError; it identifies the failure, and is the same in every release. */
FLVD_API extern int32_t g_flvd_lErrorLine;

/**
 * The one entry point.
 *
 * @param operation FLVD_OP_*; every other value returns FLVD_RET_FAILED and changes nothing
 * @param handle    address of the host's instance pointer. An open stores the new instance there, or null on failure;
 *                  the other operations read it. A close does not clear it.
 * @param arg1      input of the operation: flvd_init_t, flvd_frame_request_t or flvd_seek_request_t
 * @param arg2      output of the operation: flvd_open_info_t, flvd_frame_t or int32_t
 * @return FLVD_OP_OPEN, _OPEN_INFO, _CLOSE, _GET_FRAME, _SEEK: 0, or FLVD_RET_*.
 *         FLVD_OP_GET_LAST_ERROR: the instance's last error code, which later successes do not clear; without an
 *         instance, g_flvd_lLastError.
 *         Without an instance: FLVD_RET_NO_INSTANCE for operations 1 to 3, FLVD_RET_FAILED for operation 4.
 *         When a handle or argument that the operation needs is null: FLVD_RET_FAILED, with nothing recorded; an open
 *         still sets a non-null handle to null.
 * @note   FLVD_OP_GET_FRAME returns FLVD_RET_END at the end of the data, but also after 102 tags without a frame or
 *         16,384 false headers (bytes that only look like a tag), even if frames follow. To get every frame, retry
 *         while the reader's position advances, as flvd_next_frame of the host kit does. With FLVD_OPT_PROGRESSIVE the
 *         result also means that the next tag is still incomplete, or was when its beginning was read: retry later, and
 *         once more after the file has stopped growing. Streams that the open did not find are not found later: reopen
 *         until all expected streams are found. In a complete file, tags with later timestamps than its last tags are
 *         skipped: most of the tags before a point where the timestamps restart, as when another file was appended.
 */
FLVD_API int32_t QVX_FLV_DMX(uint32_t operation, flvd_ctx_t** handle, const void* arg1, void* arg2);

#ifdef __cplusplus
}
#endif

#include "flvdmx/layers.h" /* the exported functions below the entry point */

#endif /* FLVDMX_FLVDMX_H */
