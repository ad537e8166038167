/*
 * flvdmx: the exported functions of the layers below the entry point: the cached file and its bit reader, tag
 * navigation, codec configuration, metadata and frame seeks. Players do not need them; tools may use each on its own.
 *
 * They work on an instance opened by QVX_FLV_DMX, or on a file opened by __FLV_DMX__fioOpen after a call to
 * __FLV_DMX__fioSetFunc. Use an instance or a file from one thread at a time.
 */
#ifndef FLVDMX_LAYERS_H
#define FLVDMX_LAYERS_H

#include "flvdmx/flvdmx.h"

#ifdef __cplusplus
extern "C" {
#endif

/* ------------------------------------------------------------------------------- codes and bits */

/** Tag-kind bits: which kinds a caller wants, and which kind was found. */
enum {
    FLVD_TAG_VIDEO = 0x1,        /**< video tags */
    FLVD_TAG_AUDIO = 0x2,        /**< audio tags */
    FLVD_TAG_SCRIPT = 0x10000,   /**< script-data tags */
    FLVD_TAG_KEYFRAME = 0x20000, /**< wanted: video with FrameType 1 or 4 only; found: a keyframe */
    FLVD_TAG_CONFIG = 0x40000    /**< wanted: AAC and AVC sequence headers only, and all tags of other codecs; found:
                                      one of these */
};

/** TagType values of an FLV tag header. */
enum {
    FLVD_TAG_TYPE_AUDIO = 8,  /**< audio */
    FLVD_TAG_TYPE_VIDEO = 9,  /**< video */
    FLVD_TAG_TYPE_SCRIPT = 18 /**< script data */
};

/** Results of the navigation functions; the last two say where the search ended and are not errors. */
enum {
    FLVD_ERR_NOT_FOUND = -1,      /**< a tell or a seek failed, or no tag was found within 1 MiB */
    FLVD_ERR_AT_FIRST_TAG = -100, /**< stepping backward reached the first tag */
    FLVD_ERR_END_OF_DATA = -101   /**< reached the end of the data */
};

/** States of a cached file, fio_file_t::state. */
#define FIO_STATE_IDLE 0x80000000u /**< nothing cached */
#define FIO_STATE_READ 1u          /**< the cache holds read-ahead */
#define FIO_STATE_WRITE 2u         /**< the cache holds bytes not yet written */

/** Open modes of __FLV_DMX__fioOpen, named after those of fopen: READ is "r", WRITE (with or without TRUNCATE) "w",
 *  READ|WRITE "r+", READ|WRITE|TRUNCATE "w+", APPEND "a", READ|APPEND "a+". TEXT adds "t", BINARY "b". */
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

/* -------------------------------------------------------------------------------------- records */

/** Process-wide memory table. Every open fills it from the words of its flvd_init_t. */
typedef struct flvd_mem_funcs_t {
    flvd_mem_free_fn mem_free;   /**< word 1 */
    flvd_mem_alloc_fn mem_alloc; /**< word 0 */
    flvd_mem_copy_fn mem_copy;   /**< word 3 */
    flvd_mem_slot_fn mem_slot1;  /**< word 6 */
    flvd_mem_slot_fn mem_slot3;  /**< word 2 */
    flvd_mem_set_fn mem_set;     /**< word 5 */
} flvd_mem_funcs_t;

/** Function table of the cached file layer: seventeen slots, filled from the flvd_init_t. */
typedef struct fio_funcs_t {
    flvd_mem_alloc_fn mem_alloc;     /**< slot 0 */
    flvd_mem_slot_fn mem_slot1;      /**< slot 1, never called */
    flvd_mem_free_fn mem_free;       /**< slot 2 */
    flvd_mem_slot_fn mem_slot3;      /**< slot 3, never called */
    flvd_mem_copy_fn mem_copy;       /**< slot 4 */
    flvd_mem_slot_fn mem_slot5;      /**< slot 5, never called */
    flvd_mem_set_fn mem_set;         /**< slot 6, never called */
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

/** Cached file: one cache over one host file. Whoever opens it owns it and closes it with __FLV_DMX__fioClose. */
struct fio_file_t {
    void* handle;             /**< what file_open returned */
    uint8_t* cache;           /**< capacity + overread_extra bytes */
    uint32_t head;            /**< index of the first byte not yet consumed (reading) or written (writing) */
    uint32_t count;           /**< bytes from head on: read ahead, or pending */
    uint32_t state;           /**< FIO_STATE_* */
    uint32_t read_size;       /**< read size: a refill requests at least this many bytes */
    uint32_t capacity;        /**< cache size given at open */
    int32_t overread;         /**< non-zero: refills read beyond the request */
    uint32_t overread_extra;  /**< extra cache bytes for that */
    int32_t bits_left;        /**< bit reader: number of valid bits in `bits` */
    uint64_t bits;            /**< bit reader: the next bits, left-aligned */
    int32_t bit_skip_pending; /**< bit reader: set while it consumes bytes itself */
};

/** Description of one tag. */
typedef struct flvd_tag_info_t {
    uint32_t type;      /**< FLVD_TAG_TYPE_* */
    uint32_t data_size; /**< DataSize, 0 to 0xFFFFFF */
    uint32_t timestamp; /**< ms; TimestampExtended is the top byte */
    uint32_t stream_id; /**< StreamID; reported, never checked */
} flvd_tag_info_t;

/* ---------------------------------------------------------------------------- cached file layer */

/**
 * Installs the process-wide function table: copies all seventeen slots, which every cached file uses from now on.
 * @param funcs table to copy, borrowed for the call
 */
FLVD_API void __FLV_DMX__fioSetFunc(const fio_funcs_t* funcs);

/**
 * Opens a cached file.
 *
 * @param path           passed to the host's file_open unchanged
 * @param mode           FIO_MODE_* bits; combinations without a mode string fail before the host is called
 * @param cache_size     cache size in bytes, at least 1
 * @param overread       non-zero: a refill reads the full request in addition to the cached bytes
 * @param overread_extra extra cache bytes for that, ignored when overread is 0
 * @return file owned by the caller, or null: bad mode, file_open failed, or no memory (nothing is left open)
 */
FLVD_API fio_file_t* __FLV_DMX__fioOpen(const char* path, uint32_t mode, uint32_t cache_size, int32_t overread,
                                        uint32_t overread_extra);

/**
 * Writes pending bytes (those that the host does not accept are lost), then closes and frees `file`.
 * @return result of the host's file_close; 0 when `file` is null
 */
FLVD_API int32_t __FLV_DMX__fioClose(fio_file_t* file);

/**
 * Writes pending bytes (those that the host does not accept are lost), or drops the read-ahead without moving the
 * host's position back.
 * @return result of the host's file_flush
 */
FLVD_API int32_t __FLV_DMX__fioFlush(fio_file_t* file);

/** @return logical position in bytes, from the host's 32-bit tell; negative on failure */
FLVD_API int32_t __FLV_DMX__fioTell(fio_file_t* file);

/** @return logical position in bytes, from file_tell64 or else file_tell; negative on failure */
FLVD_API int64_t __FLV_DMX__fioTell64(fio_file_t* file);

/** @return non-zero when nothing is cached and the host reports the end of the file */
FLVD_API int32_t __FLV_DMX__fioIsEof(fio_file_t* file);

/**
 * Shows the next bytes in place without consuming them. Makes at most one host read.
 *
 * @param bytes receives a pointer into the cache, valid until the next call on `file`; not set while writing
 * @param n     bytes wanted
 * @param file  reader
 * @return bytes available at *bytes: n, or fewer at the end of the data or when the cache is smaller; 0 while writing
 */
FLVD_API uint32_t __FLV_DMX__fioShowBytesByPtr(const uint8_t** bytes, uint32_t n, fio_file_t* file);

/** Copies the next n bytes to `destination` without consuming them. @return bytes copied, at most n; 0 while writing */
FLVD_API uint32_t __FLV_DMX__fioShowBytesByCopy(void* destination, uint32_t n, fio_file_t* file);

/**
 * Consumes n bytes. Skipping past the end of the file succeeds if the host's seek does.
 * @return n; the number of bytes that were cached when the host's seek fails, or when file_seek64 is missing and the
 *         32-bit seek cannot skip that far; 0xFFFFFFFF while writing
 */
FLVD_API uint32_t __FLV_DMX__fioSkipBytes(uint32_t n, fio_file_t* file);

/**
 * Writes pending bytes, then moves the logical position. Drops the read-ahead even when the host's seek fails; a
 * relative seek to a position inside it keeps it and does not call the host.
 * @return 0; the host's result when its seek fails; -1 for an unknown origin, with the read-ahead kept
 */
FLVD_API int32_t __FLV_DMX__fioSeek(fio_file_t* file, int32_t offset, int32_t whence);

/** __FLV_DMX__fioSeek in 64 bits; without file_seek64 the host gets the low 32 bits. @return as __FLV_DMX__fioSeek */
FLVD_API int32_t __FLV_DMX__fioSeek64(fio_file_t* file, int64_t offset, int32_t whence);

/**
 * Reads and consumes `count` elements of `size` bytes. Cached bytes are copied; the rest is read straight into
 * `destination`, or through the cache when it is smaller than the read size.
 * @return whole elements read; 0, with nothing consumed, when `size` is 0 or size × count does not fit in 32 bits
 */
FLVD_API uint32_t __FLV_DMX__fioRead(void* destination, uint32_t size, uint32_t count, fio_file_t* file);

/**
 * Writes `count` elements of `size` bytes through the cache.
 * @return whole elements accepted; 0 when `size` is 0, when size × count does not fit in 32 bits, or when pending
 *         bytes could not be written (they stay pending)
 */
FLVD_API uint32_t __FLV_DMX__fioWrite(const void* source, uint32_t size, uint32_t count, fio_file_t* file);

/** Sets the read size; 0 means the whole cache. @return 1; 0 when `size` is larger than the cache */
FLVD_API int32_t __FLV_DMX__fioSetCacheReadSize(fio_file_t* file, uint32_t size);

/** @return the read size in bytes */
FLVD_API uint32_t __FLV_DMX__fioGetCacheReadSize(fio_file_t* file);

/** Debug entry without state. @return 0 */
FLVD_API uint64_t __FLV_DMX__fiodbgReadBytes(void);
/** Debug entry without effect. */
FLVD_API void __FLV_DMX__fiodbgReset(void);

/* ----------------------------------------------------------------------------------- bit reader */

/* Reads a cached file bit by bit, most significant bit first. The byte position follows: a byte counts as consumed as
 * soon as one of its bits is. Any byte-level access except a peek invalidates the bit reader; bits then read as 0
 * until __FLV_DMX__bitInit is called again. Bits past the end of the file read as 0. The cache must hold 8 bytes. */

/** Starts the bit reader at the current byte position, consuming nothing. @return 1 */
FLVD_API int32_t __FLV_DMX__bitInit(fio_file_t* file);
/** @return the next bit, not consumed */
FLVD_API uint32_t __FLV_DMX__bitShowBit(fio_file_t* file);
/** @return the next n bits (0 to 32), not consumed */
FLVD_API uint32_t __FLV_DMX__bitShowUBits(fio_file_t* file, uint32_t n);
/** Same as __FLV_DMX__bitShowUBits: does not sign-extend. */
FLVD_API uint32_t __FLV_DMX__bitShowSBits(fio_file_t* file, uint32_t n);
/** Consumes n bits (0 to 32). */
FLVD_API void __FLV_DMX__bitSkipBits(fio_file_t* file, uint32_t n);
/** Consumes any number of bits. */
FLVD_API void __FLV_DMX__bitSkipBitsLong(fio_file_t* file, uint32_t n);
/** @return the next bit, consumed */
FLVD_API uint32_t __FLV_DMX__bitGetBit(fio_file_t* file);
/** @return the next n bits (0 to 32), consumed */
FLVD_API uint32_t __FLV_DMX__bitGetUBits(fio_file_t* file, uint32_t n);
/** Same as __FLV_DMX__bitGetUBits: does not sign-extend. */
FLVD_API uint32_t __FLV_DMX__bitGetSBits(fio_file_t* file, uint32_t n);

/* ------------------------------------------------------------------------------- tag navigation */

/**
 * Finds the first tag of a wanted kind at or after the reader's position, and describes it. A reader that stands at
 * PreviousTagSize0 starts with the first tag.
 *
 * @param ctx    open instance, borrowed; used to check headers, not changed
 * @param file   reader; on success it stands at the first byte of the tag header
 * @param info   caller's record, written on success only
 * @param wanted FLVD_TAG_* bits
 * @param verify 0: check the header only; else the PreviousTagSize after the data must agree as well, except after a
 *               script tag that is the first tag of the file
 * @return 0; FLVD_ERR_NOT_FOUND; FLVD_ERR_END_OF_DATA; on failure the reader may stand anywhere
 */
FLVD_API int32_t FLVD_GetCurrTagInfo(flvd_ctx_t* ctx, fio_file_t* file, flvd_tag_info_t* info, uint32_t wanted,
                                     int32_t verify);

/**
 * Resynchronises: moves the reader to the next plausible tag header. Unlike everywhere else, a timestamp equal to the
 * file's last one is not plausible here.
 *
 * @param ctx   open instance, borrowed
 * @param file  reader; the call ignores its read size and uses up to the whole cache
 * @param limit bytes to search (the search may overrun by up to one cache); 0 finds nothing
 * @return bytes moved, 0 or more; -1 when there is none within the limit or before the end of the data, in which case
 *         the reader has moved as well
 */
FLVD_API int32_t FLVD_FindNextTag(flvd_ctx_t* ctx, fio_file_t* file, uint32_t limit);

/**
 * Steps past the tag at the reader's position to the next tag of a wanted kind, checking every PreviousTagSize on the
 * way. A reader that stands at PreviousTagSize0 starts with the first tag.
 *
 * @param ctx    open instance, borrowed
 * @param file   reader; on success it stands at the first byte of the tag header
 * @param info   caller's record, written on success only
 * @param wanted FLVD_TAG_* bits
 * @param kind   receives the FLVD_TAG_* bits of the tag found, 0 on failure; may be null
 * @return 0; FLVD_ERR_NOT_FOUND; FLVD_ERR_END_OF_DATA; on failure the reader may stand anywhere
 */
FLVD_API int32_t FLVD_MoveToNextTag(flvd_ctx_t* ctx, fio_file_t* file, flvd_tag_info_t* info, uint32_t wanted,
                                    uint32_t* kind);

/**
 * Steps back to the previous tag of a wanted kind along the PreviousTagSize chain, sliding back byte by byte where the
 * chain is damaged. The reader must stand at the start of a tag or at the end of the valid data. Parameters are those
 * of FLVD_MoveToNextTag, but `kind` reports less: only video or audio, unless keyframes or configurations were wanted.
 * @return 0; FLVD_ERR_NOT_FOUND; FLVD_ERR_AT_FIRST_TAG; FLVD_ERR_END_OF_DATA; on failure the reader may stand anywhere,
 *         even before the first tag
 */
FLVD_API int32_t FLVD_MoveToPrevTag(flvd_ctx_t* ctx, fio_file_t* file, flvd_tag_info_t* info, uint32_t wanted,
                                    uint32_t* kind);

/* -------------------------------------------------------------------------- codec configuration */

/**
 * Parses an audio codec's own header.
 *
 * @param format SoundFormat of FLV: 10 for AAC, where `data` is an AudioSpecificConfig (ISO/IEC 14496-3); 2 or 14 for
 *               MPEG audio, where `data` holds a frame header (ISO/IEC 11172-3, 13818-3) at any offset
 * @param data   bytes, borrowed
 * @param length number of bytes; MPEG needs at least 4, and a short AudioSpecificConfig reads as if zeros followed
 * @param info   AAC: receives sample_rate and channels; MPEG: also sample_size, format_tag and data_rate
 * @return 0; -1 for another format or when there is no frame header (nothing is written)
 */
FLVD_API int32_t FLVD_ParseAudioHeader(int32_t format, const uint8_t* data, int32_t length, flvd_audio_info_t* info);

/**
 * Parses the picture size from a video codec's own header.
 *
 * @param codec  CodecID of FLV: 2 Sorenson H.263, 4 VP6, 5 VP6 with alpha, 7 AVC (NAL units with start codes)
 * @param data   bytes, borrowed
 * @param length number of bytes; fewer than 8 are never a header
 * @param info   receives width and height, for AVC also fourcc
 * @return 0; -1 for another codec or an invalid header
 * @note   The AVC parser keeps process-wide state: do not run two of these calls concurrently.
 */
FLVD_API int32_t FLVD_ParseVideoHeader(int32_t codec, const uint8_t* data, int32_t length, flvd_video_info_t* info);

/**
 * Converts an AVCDecoderConfigurationRecord (ISO/IEC 14496-15) to parameter sets with four-byte start codes
 * (ISO/IEC 14496-10, annex B).
 *
 * @param record   bytes, borrowed
 * @param length   number of bytes; fewer than 7 are never a record
 * @param out      caller's buffer; may have been written to even when the result is 0
 * @param capacity size of `out` in bytes
 * @return bytes written to `out`; 0 when the record is damaged, holds no parameter sets or does not fit
 */
FLVD_API int32_t FLVD_GetAVCSeqHeaderFromAvcC(const uint8_t* record, int32_t length, uint8_t* out, int32_t capacity);

/* ------------------------------------------------------------------------------------- metadata */

/** Sets the process-wide allocator of the keyframe arrays: mem_alloc and mem_free of `init`. */
FLVD_API void FLVD_SetCallbackforMeta(const flvd_init_t* init);

/**
 * Parses a script-data payload (AMF0) and stores picture size, rates and keyframe index in the instance. Keyframe
 * arrays that the payload replaces are freed. Call FLVD_SetCallbackforMeta first.
 *
 * @param ctx    instance; its current reader stands at the first byte of the payload, and after the payload on return
 * @param length size of the payload in bytes
 * @return 0 when at least one value was parsed; -1 when none was, or when a tell failed; FLVD_ERR_END_OF_DATA when the
 *         reader could not be moved past the payload
 */
FLVD_API int32_t FLVD_ReadMetadata(flvd_ctx_t* ctx, uint32_t length);

/* -------------------------------------------------------------------------------------- seeking */

/**
 * Moves a reader to the first byte of a tag near a timestamp, by the keyframe index or by scanning. Video moves the
 * main reader to a keyframe. Audio moves the audio reader to any audio tag; when that is a separate reader and the file
 * has video, the search starts where the main reader stands.
 *
 * @param ctx       open instance of a complete file
 * @param target    file timestamp in ms (the host's time plus first_ts)
 * @param result    receives the timestamp of the tag reached; first_ts when the reader stands before the first tag,
 *                  last_ts when audio ends before the target and the reader stands at the end of the data. May also be
 *                  written on failure.
 * @param stream    FLVD_STREAM_VIDEO; any other value means audio
 * @param direction 1: at or before the target; any other value: at or after it
 * @return 0; FLVD_ERR_END_OF_DATA for a miss; another negative value for a failure, usually with error and error_line
 *         set. After a miss or a failure the reader may stand anywhere; only the time seek restores it.
 */
FLVD_API int32_t FLVD_RunFrameSeek(flvd_ctx_t* ctx, uint32_t target, uint32_t* result, uint32_t stream,
                                   uint32_t direction);

/** FLVD_RunFrameSeek for a growing file: by the index in memory, video only. Audio returns -1 with nothing recorded. */
FLVD_API int32_t FLVD_RunFrameSeekProgressive(flvd_ctx_t* ctx, uint32_t target, uint32_t* result, uint32_t stream,
                                              uint32_t direction);

#ifdef __cplusplus
}
#endif

#endif /* FLVDMX_LAYERS_H */
