/*
 * flvdmx: demultiplexer for the FLV container.
 *
 * The host loads the library, fills an flvd_init_t with its memory and file functions and the name of a
 * file, and drives the library through one entry point, QVX_FLV_DMX: open, get frames, seek, close. The
 * library finds the streams and their codec configuration, reads the metadata and delivers one audio or
 * video frame a call. It decodes nothing.
 *
 * Usable alone from C11 and from C++17. All sizes are bytes and all times milliseconds unless said
 * otherwise. Multi-byte fields of an FLV file are big-endian (FLV file format, version 10.1, annex E).
 *
 * THE HOST'S TABLES
 *
 * The library allocates, opens and reads nothing by itself: everything goes through the functions that the
 * host puts into flvd_init_t. What a host must know to write them:
 *
 * - When they are called. Only during a call of QVX_FLV_DMX or of another function of this header, on the
 *   caller's thread. They must not call back into the library.
 * - Which may be null. `file_seek64` and `file_tell64`; the 32-bit functions then serve in their place and
 *   positions beyond 2 GiB cannot be reached. The slots that are only carried (`mem_slot1`, `mem_slot3`,
 *   `mem_slot5`) and the words that are not read may hold anything. All others are called without a test.
 * - Memory. `mem_alloc` returns memory aligned for any type, or null when there is none: that is a failure
 *   that the library survives. `mem_free` must accept null. `mem_copy` is never asked for 0 bytes and its
 *   ranges do not overlap. An open allocates the instance, a reader with its cache (two with
 *   FLVD_OPT_SEPARATE_AUDIO_READER) and, unless FLVD_OPT_USER_BUFFER is set, a frame buffer of 512,000 bytes;
 *   codec configurations and keyframe arrays follow. A frame allocates only when the buffer is too small for it.
 * - Reading. `file_read` is called with an element size of 1 and returns the number of bytes read. A short
 *   read means the end of the data: a host function must fill the request or have reached the end. A host
 *   that reads from a pipe or socket has to loop. There is no retry and no separate error.
 * - Seeking and telling. `whence` is 0 from the start, 1 from the current position, 2 from the end; 0 is
 *   success. A tell returns a negative value when it fails. Seeking behind the end of the file is allowed,
 *   as fseek allows it, and a successful seek must clear the state that `file_eof` reports.
 * - Context. The memory functions and `file_open` carry none, so there is one set of them for the process:
 *   every open overwrites the process-wide tables, and all instances, older ones included, go on with the
 *   newest functions. Give every open the same functions.
 * - Threads. The library starts none and takes no locks. An open must not run beside any other call; calls
 *   on different instances may run at the same time only while no open and no call without an instance runs; one
 *   instance is used by one thread at a time. FLVD_ParseVideoHeader counts as an open: its reader for AVC is
 *   one for the process.
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
    FLVD_OP_RESERVED = 4,       /**< always refused */
    FLVD_OP_GET_LAST_ERROR = 5, /**< last error code: both arguments unused */
    FLVD_OP_OPEN_INFO = 10      /**< as FLVD_OP_OPEN, for information only: frames and seeks are refused */
};

/** Results of a failed QVX_FLV_DMX. FLVD_OP_GET_LAST_ERROR says more. */
enum {
    FLVD_RET_FAILED = -1,      /**< general failure */
    FLVD_RET_END = -2,         /**< end of the data, reading failed, or a seek missed; see QVX_FLV_DMX */
    FLVD_RET_NO_INSTANCE = -3, /**< the handle holds no instance */
    FLVD_RET_CANNOT_OPEN = -4  /**< the file cannot be opened */
};

/** Option bits of flvd_init_t::options; other bits are ignored. */
enum {
    FLVD_OPT_SEPARATE_AUDIO_READER = 0x1, /**< audio reader beside the main one; not for _OPEN_INFO */
    FLVD_OPT_USER_BUFFER = 0x2,           /**< each request brings its frame buffer */
    FLVD_OPT_PROGRESSIVE = 0x4,           /**< the file may still be growing */
    FLVD_OPT_INDEX_IN_MEMORY = 0x8        /**< keep the metadata's keyframe index in memory */
};

/** Stream bits of flvd_ctx_t::streams and stream numbers of requests and frames. */
enum {
    FLVD_STREAM_VIDEO = 1, /**< video */
    FLVD_STREAM_AUDIO = 2  /**< audio */
};

/** Seek methods of flvd_file_info_t::seek_method. */
enum {
    FLVD_SEEK_NONE = 0,     /**< not seekable */
    FLVD_SEEK_BY_INDEX = 1, /**< by the metadata's keyframe index */
    FLVD_SEEK_BY_SCAN = 2   /**< by stepping from tag to tag */
};

/** Mode bits of flvd_seek_request_t::mode. */
enum {
    FLVD_SEEK_RELATIVE = 0x10,          /**< `time` is an offset from the current position */
    FLVD_SEEK_DIRECTION_MASK = 0x300,   /**< direction; 0 and 0x300: forward unless the target is earlier than now */
    FLVD_SEEK_BACKWARD = 0x100,         /**< land on the keyframe at or before the target */
    FLVD_SEEK_FORWARD = 0x200,          /**< land on the keyframe at or after the target */
    FLVD_SEEK_TO_END_ON_MISS = 0x10000, /**< after a miss, put the readers at their end */
    FLVD_SEEK_RETRY_BACKWARD = 0x20000  /**< after a miss, retry once as an absolute backward seek to `time` */
};

/** Tag-kind bits: which tags are wanted, and which kind was found. */
enum {
    FLVD_TAG_VIDEO = 0x1,        /**< video tags */
    FLVD_TAG_AUDIO = 0x2,        /**< audio tags */
    FLVD_TAG_SCRIPT = 0x10000,   /**< script-data tags */
    FLVD_TAG_KEYFRAME = 0x20000, /**< wanted: of video only FrameType 1 or 4; found: a keyframe */
    FLVD_TAG_CONFIG = 0x40000    /**< wanted: of AAC and AVC only sequence headers; found: a sequence header, or a
                                      tag of a codec without one */
};

/** TagType values of an FLV tag header. */
enum {
    FLVD_TAG_TYPE_AUDIO = 8,  /**< audio */
    FLVD_TAG_TYPE_VIDEO = 9,  /**< video */
    FLVD_TAG_TYPE_SCRIPT = 18 /**< script data */
};

/** flvd_audio_info_t::format_tag values: registered WAVE format tags, and the library's own for AAC. */
enum {
    FLVD_AUDIO_TAG_MPEG = 0x50, /**< MPEG audio layer 2, from FLVD_ParseAudioHeader alone */
    FLVD_AUDIO_TAG_MP3 = 0x55,  /**< MPEG audio layer 3 or 1; every stream that FLV calls MP3 */
    FLVD_AUDIO_TAG_AAC = 0xAAC0 /**< AAC */
};

/** Results of the navigation functions; the last two are places in the file, not faults. */
enum {
    FLVD_ERR_NOT_FOUND = -1,      /**< a position query or a seek failed, or 1 MiB held no plausible tag */
    FLVD_ERR_AT_FIRST_TAG = -100, /**< stepping backward reached the first tag */
    FLVD_ERR_END_OF_DATA = -101   /**< the data ended */
};

/** Error codes, as recorded in flvd_ctx_t::error or in g_flvd_lLastError. */
enum {
    FLVD_ERR_NONE = 0,                  /**< none; also recorded when a frame did not fit and was passed over */
    FLVD_ERR_POSITION = -1,             /**< the host could not tell a position */
    FLVD_ERR_SEEK = -2,                 /**< a host seek failed */
    FLVD_ERR_NO_MEMORY = -3,            /**< no memory for a codec configuration, or one too short to be one */
    FLVD_ERR_INSTANCE_MEMORY = -4,      /**< no memory for the instance */
    FLVD_ERR_OPEN_MAIN = -5,            /**< the main reader cannot be opened */
    FLVD_ERR_OPEN_AUDIO = -6,           /**< the audio reader cannot be opened */
    FLVD_ERR_FRAME_BUFFER = -7,         /**< no memory for the frame buffer */
    FLVD_ERR_NO_STREAM = -1002,         /**< neither a video nor an audio stream was found */
    FLVD_ERR_FILE_HEADER = -1004,       /**< no FLV file header, or one that cannot be right */
    FLVD_ERR_EXTENT = -1005,            /**< the end of the valid data was not found */
    FLVD_ERR_FRAME_SEEK = -2000,        /**< a frame seek failed */
    FLVD_ERR_SEEK_MISS = -2003,         /**< the target is beyond the end, or no keyframe lies in that direction */
    FLVD_ERR_SEEK_PLACE = -2006,        /**< no tag, or not the one expected, where a seek led */
    FLVD_ERR_INDEX_ELEMENT = -2007,     /**< a keyframe position in the metadata is not a number */
    FLVD_ERR_AVC_CONFIG = -3001,        /**< AVC record: damaged, or not 1 to 128 bytes of parameter sets */
    FLVD_ERR_VIDEO_HEADER = -3002,      /**< a picture header or sequence parameter set was not understood */
    FLVD_ERR_AUDIO_HEADER = -3003,      /**< no MPEG audio frame header */
    FLVD_ERR_AVC_NO_SEQ_HEADER = -3004, /**< the first AVC tag is not a sequence header */
    FLVD_ERR_NO_INSTANCE = -4001,       /**< the handle holds no instance */
    FLVD_ERR_NO_VIDEO = -4002,          /**< video requested of a file without it */
    FLVD_ERR_NO_AUDIO = -4003,          /**< audio requested of a file without it */
    FLVD_ERR_BAD_STREAM = -4004,        /**< the requested stream is neither video nor audio */
    FLVD_ERR_RESERVED_OP = -4006,       /**< operation 4 */
    FLVD_ERR_INFO_ONLY = -4007,         /**< the instance was opened for information only */
    FLVD_ERR_NO_TAG = -10001,           /**< no valid tag was found */
    FLVD_ERR_SHORT_DATA = -10002,       /**< end of the data, or a short read */
    FLVD_ERR_NOT_SEEKABLE = -10003      /**< no seek method; growing file: no video, or no index in memory */
};

/** States of a cached file, fio_file_t::state. */
#define FIO_STATE_IDLE 0x80000000u /**< nothing cached */
#define FIO_STATE_READ 1u          /**< the cache holds read-ahead */
#define FIO_STATE_WRITE 2u         /**< the cache holds bytes to be written */

/** Open modes of __FLV_DMX__fioOpen: "r", "w" (with or without TRUNCATE), "r+" READ|WRITE, "w+" with TRUNCATE,
 *  "a", "a+" READ|APPEND; then "t" or "b". */
enum {
    FIO_MODE_TRUNCATE = 0x01, /**< truncate */
    FIO_MODE_READ = 0x10,     /**< read */
    FIO_MODE_WRITE = 0x20,    /**< write */
    FIO_MODE_APPEND = 0x40,   /**< append */
    FIO_MODE_TEXT = 0x100,    /**< text */
    FIO_MODE_BINARY = 0x200   /**< binary */
};

/** Seek origins: start, current position, end. */
enum {
    FIO_SEEK_SET = 0, /**< from the start */
    FIO_SEEK_CUR = 1, /**< from the current position */
    FIO_SEEK_END = 2  /**< from the end */
};

/* --------------------------------------------------------------------------- the host's functions */

typedef void* (*flvd_mem_alloc_fn)(uint32_t size);                                        /**< memory, or null */
typedef void (*flvd_mem_free_fn)(void* memory);                                           /**< accepts null */
typedef void* (*flvd_mem_copy_fn)(void* destination, const void* source, uint32_t count); /**< result ignored */
typedef void* (*flvd_mem_set_fn)(void* destination, int value, uint32_t count);           /**< result ignored */
typedef void (*flvd_mem_slot_fn)(void);                                                   /**< carried, never called */

typedef void* (*flvd_file_open_fn)(const char* path, const char* mode); /**< handle, or null */
typedef uint32_t (*flvd_file_read_fn)(void* buffer, uint32_t size, uint32_t count, void* handle); /**< bytes read */
typedef uint32_t (*flvd_file_write_fn)(const void* buffer, uint32_t size, uint32_t count,
                                       void* handle);                               /**< bytes written */
typedef int32_t (*flvd_file_seek_fn)(void* handle, int32_t offset, int32_t whence); /**< 0 on success */
typedef int32_t (*flvd_file_tell_fn)(void* handle);  /**< position, negative on failure */
typedef int32_t (*flvd_file_close_fn)(void* handle); /**< passed through */
typedef int32_t (*flvd_file_eof_fn)(void* handle);   /**< non-zero at the end of the file */
typedef int32_t (*flvd_file_flush_fn)(void* handle); /**< passed through */
typedef int32_t (*flvd_file_seek64_fn)(void* handle, int64_t offset, int32_t whence); /**< 0 on success */
typedef int64_t (*flvd_file_tell64_fn)(void* handle); /**< position, negative on failure */

/**
 * Initialisation block of operations 0 and 10: 36 words, each as wide as a pointer (word n lies at n × pointer
 * size). Read only during the call, except the string behind `file_name`, which must live until close.
 */
typedef struct flvd_init_t {
    flvd_mem_alloc_fn mem_alloc;     /**< word 0 */
    flvd_mem_free_fn mem_free;       /**< word 1 */
    flvd_mem_slot_fn mem_slot3;      /**< word 2, carried */
    flvd_mem_copy_fn mem_copy;       /**< word 3 */
    flvd_mem_slot_fn mem_slot5;      /**< word 4, carried */
    flvd_mem_set_fn mem_set;         /**< word 5 */
    flvd_mem_slot_fn mem_slot1;      /**< word 6, carried */
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
    const char* file_name;           /**< word 32: path, passed unchanged to file_open; must live until close */
    uintptr_t options;               /**< word 33: FLVD_OPT_* bits */
    uintptr_t cache_size;            /**< word 34: cache of each reader; 0: 4096, 1 to 1023: 1024 */
    uintptr_t scan_read_size;        /**< word 35: bytes a read while scanning; 0: 16, at most the cache size */
} flvd_init_t;

/** Process-wide memory table, filled from the initialisation block at every open. */
typedef struct flvd_mem_funcs_t {
    flvd_mem_free_fn mem_free;   /**< word 1 */
    flvd_mem_alloc_fn mem_alloc; /**< word 0 */
    flvd_mem_copy_fn mem_copy;   /**< word 3 */
    flvd_mem_slot_fn mem_slot1;  /**< word 6 */
    flvd_mem_slot_fn mem_slot3;  /**< word 2 */
    flvd_mem_set_fn mem_set;     /**< word 5 */
} flvd_mem_funcs_t;

/** File-function table of the cached file layer: seventeen slots, filled from the initialisation block. */
typedef struct fio_funcs_t {
    flvd_mem_alloc_fn mem_alloc;     /**< slot 0 */
    flvd_mem_slot_fn mem_slot1;      /**< slot 1, carried */
    flvd_mem_free_fn mem_free;       /**< slot 2 */
    flvd_mem_slot_fn mem_slot3;      /**< slot 3, carried */
    flvd_mem_copy_fn mem_copy;       /**< slot 4 */
    flvd_mem_slot_fn mem_slot5;      /**< slot 5, carried */
    flvd_mem_set_fn mem_set;         /**< slot 6, carried */
    flvd_file_open_fn file_open;     /**< slot 7 */
    flvd_file_close_fn file_close;   /**< slot 8 */
    flvd_file_read_fn file_read;     /**< slot 9 */
    flvd_file_write_fn file_write;   /**< slot 10 */
    flvd_file_seek_fn file_seek;     /**< slot 11 */
    flvd_file_tell_fn file_tell;     /**< slot 12 */
    flvd_file_eof_fn file_eof;       /**< slot 13 */
    flvd_file_flush_fn file_flush;   /**< slot 14 */
    flvd_file_seek64_fn file_seek64; /**< slot 15, may be null */
    flvd_file_tell64_fn file_tell64; /**< slot 16, may be null */
} fio_funcs_t;

/* -------------------------------------------------------------------------------------- records */

/** Cached file object: one cache over one host file. Owned by whoever opened it, ended by __FLV_DMX__fioClose. */
typedef struct fio_file_t {
    void* handle;             /**< what file_open returned */
    uint8_t* cache;           /**< capacity + overread_extra bytes */
    uint32_t head;            /**< index of the first byte not yet consumed, or not yet written out */
    uint32_t count;           /**< bytes from head on: read-ahead, or pending */
    uint32_t state;           /**< FIO_STATE_* */
    uint32_t read_size;       /**< refill quantum: the least number of bytes that a refill asks for */
    uint32_t capacity;        /**< cache size given at open */
    int32_t overread;         /**< refill beyond the request */
    uint32_t overread_extra;  /**< extra cache bytes for it */
    int32_t bits_left;        /**< bit reader: number of valid bits in `bits` */
    uint64_t bits;            /**< bit reader: the next bits, left-aligned */
    int32_t bit_skip_pending; /**< bit reader: it consumes the next bytes itself */
} fio_file_t;

/** What is known of the file as a whole. Lives inside the instance until close. */
typedef struct flvd_file_info_t {
    const char* file_name; /**< as given at open, borrowed from the host */
    uint32_t duration_ms;  /**< last timestamp minus first, 0 when unknown */
    int64_t file_size;     /**< bytes, 0 for a growing file */
    uint32_t seek_method;  /**< FLVD_SEEK_NONE, FLVD_SEEK_BY_INDEX or FLVD_SEEK_BY_SCAN */
} flvd_file_info_t;

/** Video description. Lives inside the instance until close; 0 in all that the file does not tell. */
typedef struct flvd_video_info_t {
    uint32_t reserved;         /**< 0 */
    uint32_t width;            /**< pixels */
    uint32_t height;           /**< pixels */
    uint32_t frame_rate;       /**< thousandths of a frame a second, from metadata */
    char fourcc[4];            /**< "JPEG" "FLV1" "SCR1" "VP60" "VP6A" "SCR2" "H264"; zeros: unknown CodecID */
    uint8_t* config;           /**< AVC: AVCDecoderConfigurationRecord (ISO/IEC 14496-15), else null; the instance's */
    uint32_t config_size;      /**< its bytes */
    uint32_t last_key_time_ms; /**< file timestamp of the last keyframe, ms, from the index or the metadata */
} flvd_video_info_t;

/** Audio description. Lives inside the instance until close; 0 in all that the file does not tell. */
typedef struct flvd_audio_info_t {
    uint32_t reserved;    /**< 0 */
    uint32_t sample_rate; /**< Hz */
    uint32_t sample_size; /**< bits a sample */
    uint32_t channels;    /**< channel count */
    uint32_t format_tag;  /**< FLVD_AUDIO_TAG_*, 0 for every other sound format */
    uint8_t* config;      /**< AAC: AudioSpecificConfig (ISO/IEC 14496-3), else null; owned by the instance */
    uint32_t config_size; /**< its bytes */
    uint32_t reserved2;   /**< 0 */
    uint32_t data_rate;   /**< kbit/s */
} flvd_audio_info_t;

/** Result of operations 0 and 10: seven words, each as wide as a pointer; meaningful after success, until close. */
typedef struct flvd_open_info_t {
    const flvd_file_info_t* file_info;     /**< the file */
    uintptr_t has_video;                   /**< 1 when a video stream was found */
    const flvd_video_info_t* video_info;   /**< the video stream, or null */
    const flvd_video_info_t* video_config; /**< the same pointer again */
    uintptr_t has_audio;                   /**< 1 when an audio stream was found */
    const flvd_audio_info_t* audio_info;   /**< the audio stream, or null */
    const flvd_audio_info_t* audio_config; /**< the same pointer again */
} flvd_open_info_t;

/** First argument of operation 2. A null buffer counts as one of 0 bytes. */
typedef struct flvd_frame_request_t {
    uint8_t* buffer;      /**< with FLVD_OPT_USER_BUFFER: where the frame goes; else not looked at */
    uint32_t buffer_size; /**< its bytes */
    uint32_t stream;      /**< with FLVD_OPT_SEPARATE_AUDIO_READER: FLVD_STREAM_VIDEO or _AUDIO; else not looked at */
} flvd_frame_request_t;

/**
 * Second argument of operation 2, cleared at the start of every request that is not refused. `data` is valid until the
 * next request on the instance.
 */
typedef struct flvd_frame_t {
    uint8_t* data;         /**< payload without the FLV codec header bytes */
    uint32_t size;         /**< bytes */
    uint32_t stream;       /**< FLVD_STREAM_VIDEO or FLVD_STREAM_AUDIO */
    uint32_t timestamp_ms; /**< tag timestamp minus the first timestamp (decoding order), wrapping */
    uint32_t reserved[2];  /**< 0 */
} flvd_frame_t;

/**
 * First argument of operation 3; the second is an int32_t that receives the time reached, in ms from the first
 * timestamp, on success only. The current position is the time of the last video frame, without video of the last audio
 * frame. A target at or before 0 goes to the first tag, a relative time of 0 only reports. A miss (FLVD_RET_END) is a
 * target beyond the end, or without a keyframe in its direction; after it and after any failure delivery goes on where
 * it was.
 */
typedef struct flvd_seek_request_t {
    int32_t time;  /**< ms, from the first timestamp; with FLVD_SEEK_RELATIVE from the current position */
    uint32_t mode; /**< FLVD_SEEK_RELATIVE, _BACKWARD, _FORWARD, _TO_END_ON_MISS, _RETRY_BACKWARD */
} flvd_seek_request_t;

/** Description of one tag. */
typedef struct flvd_tag_info_t {
    uint32_t type;      /**< FLVD_TAG_TYPE_* */
    uint32_t data_size; /**< DataSize, 0 to 0xFFFFFF */
    uint32_t timestamp; /**< ms; TimestampExtended is the top byte */
    uint32_t stream_id; /**< StreamID, reported and never tested */
} flvd_tag_info_t;

/** Keyframe index as it lies in the file: AMF0 strict arrays of the metadata's "keyframes" object. */
typedef struct flvd_keyframe_index_t {
    int64_t times_offset;     /**< file offset of the first element of "times", 0 when there is none */
    int64_t positions_offset; /**< file offset of the first element of "filepositions", 0 when there is none */
    uint32_t entry_count;     /**< usable entries; 0xFFFFFFFF when "keyframes" held no array */
} flvd_keyframe_index_t;

/** Keyframe index in memory, with FLVD_OPT_PROGRESSIVE or FLVD_OPT_INDEX_IN_MEMORY; owned by the instance. */
typedef struct flvd_keyframe_arrays_t {
    uint32_t times_count;     /**< entries of times_ms */
    uint32_t* times_ms;       /**< ms, or null */
    uint32_t positions_count; /**< entries of positions */
    int64_t* positions;       /**< file offsets, or null */
} flvd_keyframe_arrays_t;

/** Instance: one open file. Made by operations 0 and 10, owned by the handle until operation 1. A host only reads. */
typedef struct flvd_ctx_t {
    fio_file_t* cur_reader;                 /**< reader of probing and navigation: the main reader */
    fio_file_t* main_reader;                /**< video, and audio too unless it has a reader of its own */
    fio_file_t* audio_reader;               /**< the separate audio reader, else the main reader */
    uint32_t options;                       /**< FLVD_OPT_* */
    uint32_t seek_method;                   /**< FLVD_SEEK_NONE, _BY_INDEX, _BY_SCAN */
    uint32_t opened_for_info;               /**< 1 when opened with operation 10 */
    uint8_t* frame_buffer;                  /**< frames are copied here */
    uint32_t frame_buffer_size;             /**< its capacity */
    uint32_t cache_size;                    /**< cache of each reader */
    uint32_t scan_read_size;                /**< refill quantum while scanning */
    uint32_t byte_rate;                     /**< bytes per 1024 ms, 0 when unknown */
    uint32_t streams;                       /**< FLVD_STREAM_* bits: announced by the header, then those found */
    flvd_file_info_t file_info;             /**< what the host is told of the file */
    flvd_video_info_t video_info;           /**< and of its video */
    flvd_audio_info_t audio_info;           /**< and of its audio */
    int64_t file_size;                      /**< bytes; INT64_MAX while a growing file is probed, then 0 */
    int64_t data_end;                       /**< end of the valid data; INT64_MAX for a growing file */
    int32_t data_offset;                    /**< DataOffset of the file header: place of PreviousTagSize0 */
    uint32_t last_frame_size;               /**< bytes of the last frame read */
    uint32_t last_video_ts;                 /**< time of the last video frame, from first_ts */
    uint32_t last_audio_ts;                 /**< time of the last audio frame, from first_ts */
    uint32_t duration_ms;                   /**< last_ts - first_ts */
    uint32_t first_ts;                      /**< smallest media timestamp seen while probing */
    uint32_t last_ts;                       /**< last timestamp of the file, 0 until known: ceiling for headers */
    uint32_t audio_delay_ms;                /**< metadata "audiodelay" */
    uint32_t video_codec_filter;            /**< 0xFFFF, or the video tag header byte taken */
    uint32_t audio_format_filter;           /**< 0xFFFF, or the audio tag header byte taken */
    flvd_keyframe_index_t keyframe_index;   /**< index in the file */
    int64_t last_keyframe_pos;              /**< metadata "lastkeyframelocation" */
    uint32_t last_keyframe_ms;              /**< metadata "lastkeyframetimestamp", or from the index */
    uint32_t file_shorter_than_meta;        /**< 1 when the metadata's "filesize" is larger than the file */
    int64_t saved_main_pos;                 /**< where to go back to after a failure; 0 when nowhere */
    int64_t saved_audio_pos;                /**< the same for the audio reader */
    flvd_keyframe_arrays_t keyframe_arrays; /**< index in memory */
    int32_t error;                          /**< last error code, FLVD_ERR_* */
    int32_t error_line;                     /**< fixed number of the place of failure */
} flvd_ctx_t;

/* ---------------------------------------------------------------------------------- entry point */

/** Error code of the last failure that had no instance to be recorded in (a failed open, a call without instance). */
FLVD_API extern int32_t g_flvd_lLastError;
/** Line number that goes with g_flvd_lLastError; identifies the place of failure, the same in every release. */
FLVD_API extern int32_t g_flvd_lErrorLine;

/**
 * The one entry point.
 *
 * @param operation FLVD_OP_*; every other value returns FLVD_RET_FAILED and touches nothing
 * @param handle    address of a word that the host owns. Opening stores the new instance there, or null when it
 *                  fails; the other operations read it. Closing does not clear it.
 * @param arg1      what the operation reads: flvd_init_t, flvd_frame_request_t or flvd_seek_request_t
 * @param arg2      what it fills: flvd_open_info_t, flvd_frame_t or int32_t
 * @return FLVD_OP_OPEN, _OPEN_INFO, _CLOSE, _GET_FRAME, _SEEK: 0, or FLVD_RET_*.
 *         FLVD_OP_GET_LAST_ERROR: the instance's last error code, which later successes leave in place; without an
 *         instance g_flvd_lLastError.
 *         A handle without instance: FLVD_RET_NO_INSTANCE for operations 1 to 3, FLVD_RET_FAILED for operation 4.
 *         A null argument that the operation needs: FLVD_RET_FAILED, nothing recorded, nothing touched.
 *         FLVD_OP_GET_FRAME returns FLVD_RET_END at the end of the data, and after 102 tags without a frame, however
 *         much follows them: a host that wants to be sure asks again while the reader stands inside the file. With
 *         FLVD_OPT_PROGRESSIVE it also means that the next tag is not whole yet, or was not when its beginning was
 *         read: ask again after a while, once more after the file has stopped growing. Streams that the open did not
 *         find are not found later: open again until those that are awaited are there. Of a complete file tags with a
 *         time later than its last ones are passed over, as most of a second file that was appended to it may be.
 */
FLVD_API int32_t QVX_FLV_DMX(uint32_t operation, flvd_ctx_t** handle, const void* arg1, void* arg2);

/* ---------------------------------------------------------------------------- cached file layer */

/**
 * Installs the process-wide file table: a copy of all seventeen slots, used by every cached file from now on.
 * @param funcs table to copy, borrowed for the call
 */
FLVD_API void __FLV_DMX__fioSetFunc(const fio_funcs_t* funcs);

/**
 * Opens a cached file.
 *
 * @param path           passed unchanged to the host's file_open
 * @param mode           FIO_MODE_* bits; combinations that no mode string has are refused before the host is asked
 * @param cache_size     bytes of the cache, at least 1
 * @param overread       non-zero: a refill asks for the whole request behind the cached bytes
 * @param overread_extra extra cache bytes for that, not looked at when overread is 0
 * @return object owned by the caller, or null: bad mode, file_open failed, no memory (nothing is left open)
 */
FLVD_API fio_file_t* __FLV_DMX__fioOpen(const char* path, uint32_t mode, uint32_t cache_size, int32_t overread,
                                        uint32_t overread_extra);

/**
 * Closes and releases `file`, pending bytes being written first; those that the host does not take are lost.
 * @return the host's result of file_close; 0 for null
 */
FLVD_API int32_t __FLV_DMX__fioClose(fio_file_t* file);

/**
 * Writes pending bytes (those that the host does not take are lost) or drops the read-ahead (the host's position is not
 * moved back).
 * @return the host's result of file_flush
 */
FLVD_API int32_t __FLV_DMX__fioFlush(fio_file_t* file);

/** @return logical position in bytes through the host's 32-bit tell; negative when the host failed */
FLVD_API int32_t __FLV_DMX__fioTell(fio_file_t* file);

/** @return logical position in bytes (file_tell64, else file_tell); negative when the host failed */
FLVD_API int64_t __FLV_DMX__fioTell64(fio_file_t* file);

/** @return non-zero only when nothing is cached and the host reports the end of the file */
FLVD_API int32_t __FLV_DMX__fioIsEof(fio_file_t* file);

/**
 * Shows the next bytes in place, consuming nothing: at most one host read.
 *
 * @param bytes receives a pointer into the cache, valid until the next call on `file`; untouched while writing
 * @param n     bytes wanted; more than the cache holds comes back short
 * @param file  reader
 * @return bytes available at *bytes, at most n; fewer than n: the data ended, or the cache is smaller; 0 while writing
 */
FLVD_API uint32_t __FLV_DMX__fioShowBytesByPtr(const uint8_t** bytes, uint32_t n, fio_file_t* file);

/** Copies the next n bytes to `destination`, consuming nothing. @return bytes copied, at most n; 0 while writing */
FLVD_API uint32_t __FLV_DMX__fioShowBytesByCopy(void* destination, uint32_t n, fio_file_t* file);

/**
 * Consumes n bytes. Going behind the end of the file succeeds when the host's seek does.
 * @return n; only those that were cached when the host's seek failed, or cannot go so far without file_seek64;
 *         0xFFFFFFFF while writing
 */
FLVD_API uint32_t __FLV_DMX__fioSkipBytes(uint32_t n, fio_file_t* file);

/**
 * Moves the logical position, pending bytes being written first. What was read ahead is dropped, also when the host's
 * seek fails, unless the target lies inside it.
 * @return 0; the host's result when it failed; -1 for an unknown origin, which drops nothing
 */
FLVD_API int32_t __FLV_DMX__fioSeek(fio_file_t* file, int32_t offset, int32_t whence);

/** The same in 64 bits; without file_seek64 the host gets the low 32 bits. @return as __FLV_DMX__fioSeek */
FLVD_API int32_t __FLV_DMX__fioSeek64(fio_file_t* file, int64_t offset, int32_t whence);

/**
 * Reads and consumes `count` elements of `size` bytes. What is cached is copied; what is missing goes straight to
 * `destination`, or through the cache when it is less than the refill quantum.
 * @return whole elements delivered; 0, nothing moved, when `size` is 0 or size × count does not fit 32 bits
 */
FLVD_API uint32_t __FLV_DMX__fioRead(void* destination, uint32_t size, uint32_t count, fio_file_t* file);

/**
 * Writes `count` elements of `size` bytes through the cache.
 * @return whole elements accepted; 0 as for reading, and when pending bytes could not be written: they stay pending
 */
FLVD_API uint32_t __FLV_DMX__fioWrite(const void* source, uint32_t size, uint32_t count, fio_file_t* file);

/** Sets the refill quantum; 0 means the whole cache. @return 1; 0 when `size` is above the capacity */
FLVD_API int32_t __FLV_DMX__fioSetCacheReadSize(fio_file_t* file, uint32_t size);

/** @return the refill quantum in bytes */
FLVD_API uint32_t __FLV_DMX__fioGetCacheReadSize(fio_file_t* file);

/** Debug entry without state. @return 0 */
FLVD_API uint64_t __FLV_DMX__fiodbgReadBytes(void);
/** Debug entry without effect. */
FLVD_API void __FLV_DMX__fiodbgReset(void);

/* ----------------------------------------------------------------------------------- bit reader */

/* Reads a cached file bit by bit, most significant bit first. The byte position stays in step: a byte of which
 * one bit was consumed counts as consumed. After any byte-level access but a peek it must be started again;
 * until then bits read as 0. Bits behind the end of the file read as 0. The cache must hold 8 bytes. */

/** Starts at the current byte position, consuming nothing. @return 1 */
FLVD_API int32_t __FLV_DMX__bitInit(fio_file_t* file);
/** @return the next bit, not consumed */
FLVD_API uint32_t __FLV_DMX__bitShowBit(fio_file_t* file);
/** @return the next n bits (0 to 32), not consumed */
FLVD_API uint32_t __FLV_DMX__bitShowUBits(fio_file_t* file, uint32_t n);
/** Second name of __FLV_DMX__bitShowUBits: no sign extension. */
FLVD_API uint32_t __FLV_DMX__bitShowSBits(fio_file_t* file, uint32_t n);
/** Consumes n bits (0 to 32). */
FLVD_API void __FLV_DMX__bitSkipBits(fio_file_t* file, uint32_t n);
/** Consumes any number of bits. */
FLVD_API void __FLV_DMX__bitSkipBitsLong(fio_file_t* file, uint32_t n);
/** @return the next bit, consumed */
FLVD_API uint32_t __FLV_DMX__bitGetBit(fio_file_t* file);
/** @return the next n bits (0 to 32), consumed */
FLVD_API uint32_t __FLV_DMX__bitGetUBits(fio_file_t* file, uint32_t n);
/** Second name of __FLV_DMX__bitGetUBits: no sign extension. */
FLVD_API uint32_t __FLV_DMX__bitGetSBits(fio_file_t* file, uint32_t n);

/* ------------------------------------------------------------------------------- tag navigation */

/**
 * Describes the first tag of a wanted kind at or after the reader's position; on PreviousTagSize0, the first tag's.
 *
 * @param ctx    open instance, borrowed; its description of the file is read, not changed
 * @param file   reader; on success it stands on the first byte of the tag header
 * @param info   caller's record, written on success only
 * @param wanted FLVD_TAG_* bits
 * @param verify 0: header test only; else the PreviousTagSize behind the data must agree as well, except behind a
 *               script tag that is the first tag of the file
 * @return 0; FLVD_ERR_NOT_FOUND; FLVD_ERR_END_OF_DATA; on failure the reader may stand anywhere
 */
FLVD_API int32_t FLVD_GetCurrTagInfo(flvd_ctx_t* ctx, fio_file_t* file, flvd_tag_info_t* info, uint32_t wanted,
                                     int32_t verify);

/**
 * Resynchronises: looks for the next place where a plausible tag header stands and moves there. Here alone a timestamp
 * equal to the file's last one is not plausible.
 *
 * @param ctx   open instance, borrowed
 * @param file  reader; its refill quantum is the whole cache for the time of the call
 * @param limit bytes after which the search ends (it may overrun by one cache); 0 finds nothing
 * @return bytes moved, 0 or more; -1 when there is none within the limit or the data, the reader having moved
 */
FLVD_API int32_t FLVD_FindNextTag(flvd_ctx_t* ctx, fio_file_t* file, uint32_t limit);

/**
 * Steps past the tag at the position to the next tag of a wanted kind, checking every PreviousTagSize on the way.
 * At the first tag's PreviousTagSize0 the first tag is a candidate itself.
 *
 * @param ctx    open instance, borrowed
 * @param file   reader; on success it stands on the first byte of the tag header
 * @param info   caller's record, written on success only
 * @param wanted FLVD_TAG_* bits
 * @param kind   receives the FLVD_TAG_* bits of the tag found, 0 on failure; may be null
 * @return 0; FLVD_ERR_NOT_FOUND; FLVD_ERR_END_OF_DATA; on failure the reader may stand anywhere
 */
FLVD_API int32_t FLVD_MoveToNextTag(flvd_ctx_t* ctx, fio_file_t* file, flvd_tag_info_t* info, uint32_t wanted,
                                    uint32_t* kind);

/**
 * Steps back to the previous tag of a wanted kind through the PreviousTagSize chain, sliding back byte by byte
 * where the chain is damaged. The reader must stand on a tag or on the end of the valid data. Parameters as
 * FLVD_MoveToNextTag; the kind reported is coarser (video or audio alone, unless keyframes or configurations were
 * wanted).
 * @return 0; FLVD_ERR_NOT_FOUND; FLVD_ERR_AT_FIRST_TAG; FLVD_ERR_END_OF_DATA; on failure the reader may stand anywhere,
 *         in front of the first tag included
 */
FLVD_API int32_t FLVD_MoveToPrevTag(flvd_ctx_t* ctx, fio_file_t* file, flvd_tag_info_t* info, uint32_t wanted,
                                    uint32_t* kind);

/* -------------------------------------------------------------------------- codec configuration */

/**
 * Reads an audio codec's own header.
 *
 * @param format SoundFormat of FLV: 10 AAC, `data` being an AudioSpecificConfig (ISO/IEC 14496-3); 2 or 14 MPEG
 *               audio, `data` holding a frame header (ISO/IEC 11172-3, 13818-3) somewhere
 * @param data   bytes, borrowed
 * @param length their number; MPEG needs 4, a short AudioSpecificConfig reads as if zeros followed
 * @param info   AAC: sample_rate and channels are written; MPEG: those, sample_size, format_tag and data_rate
 * @return 0; -1 for another format or when no frame header was found (nothing is written)
 */
FLVD_API int32_t FLVD_ParseAudioHeader(int32_t format, const uint8_t* data, int32_t length, flvd_audio_info_t* info);

/**
 * Reads the picture size from a video codec's own header.
 *
 * @param codec  CodecID of FLV: 2 Sorenson H.263, 4 VP6, 5 VP6 with alpha, 7 AVC as start-code prefixed NAL units
 * @param data   bytes, borrowed
 * @param length their number; fewer than 8 are no header
 * @param info   width and height are written, for AVC fourcc too
 * @return 0; -1 for another codec or a header that was not understood
 * @note   AVC: the reader is one for the process, so no two of these calls may run at the same time.
 */
FLVD_API int32_t FLVD_ParseVideoHeader(int32_t codec, const uint8_t* data, int32_t length, flvd_video_info_t* info);

/**
 * Turns an AVCDecoderConfigurationRecord (ISO/IEC 14496-15) into parameter sets with four-byte start codes
 * (ISO/IEC 14496-10, annex B).
 *
 * @param record   bytes, borrowed
 * @param length   their number; fewer than 7 are no record
 * @param out      caller's buffer; holds part of the sets when they do not fit
 * @param capacity its bytes
 * @return bytes written to `out`; 0 when the record is damaged, holds no parameter set or does not fit
 */
FLVD_API int32_t FLVD_GetAVCSeqHeaderFromAvcC(const uint8_t* record, int32_t length, uint8_t* out, int32_t capacity);

/* ------------------------------------------------------------------------------------- metadata */

/** Takes mem_alloc and mem_free of `init` as the process-wide allocator of the keyframe arrays. */
FLVD_API void FLVD_SetCallbackforMeta(const flvd_init_t* init);

/**
 * Reads a script-data payload (AMF0) into the instance: picture size, rates, keyframe index. A keyframe array that the
 * instance holds is released when the payload brings another. FLVD_SetCallbackforMeta comes first.
 *
 * @param ctx    instance; its current reader stands on the first byte of the payload and ends behind it
 * @param length bytes of the payload
 * @return 0 when at least one value was parsed; -1 when none was, and when the position cannot be taken;
 *         FLVD_ERR_END_OF_DATA when the reader could not be put behind the payload
 */
FLVD_API int32_t FLVD_ReadMetadata(flvd_ctx_t* ctx, uint32_t length);

/* -------------------------------------------------------------------------------------- seeking */

/**
 * Puts a reader on the first byte of a tag near a timestamp, by the keyframe index or by scanning: video the main
 * reader, on a keyframe; audio the audio reader, on any audio tag, starting where the main reader stands when it has a
 * reader of its own and the file has video.
 *
 * @param ctx       open instance of a complete file
 * @param target    file timestamp in ms (the host's time plus first_ts)
 * @param result    receives the timestamp of the tag reached; first_ts when the reader was put in front of the first
 *                  tag, last_ts when audio ends before the target and the reader was put at the end of the data. May be
 *                  written on failure as well.
 * @param stream    FLVD_STREAM_VIDEO; any other value is audio
 * @param direction 1: the keyframe at or before the target; any other value: at or after it
 * @return 0; FLVD_ERR_END_OF_DATA for a miss; another negative value for a failure, mostly with error and error_line
 * set. After both the reader may stand anywhere: it is the time seek that puts it back.
 */
FLVD_API int32_t FLVD_RunFrameSeek(flvd_ctx_t* ctx, uint32_t target, uint32_t* result, uint32_t stream,
                                   uint32_t direction);

/** The same for a growing file: by the index in memory, video only (-1 at once for audio, nothing recorded). */
FLVD_API int32_t FLVD_RunFrameSeekProgressive(flvd_ctx_t* ctx, uint32_t target, uint32_t* result, uint32_t stream,
                                              uint32_t direction);

#ifdef __cplusplus
}
#endif

#endif /* FLVDMX_FLVDMX_H */
