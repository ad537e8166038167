/*
 * flvdmx: the exported functions of the layers below the entry point, each usable alone: the cached file and its bit
 * reader, tag navigation, codec configuration, metadata and frame seeks. A player needs none of them.
 *
 * They work on an instance that QVX_FLV_DMX opened, or on a file that __FLV_DMX__fioOpen opened after
 * __FLV_DMX__fioSetFunc. One thread per instance and per file.
 */
#ifndef FLVDMX_LAYERS_H
#define FLVDMX_LAYERS_H

#include "flvdmx/flvdmx.h"

#ifdef __cplusplus
extern "C" {
#endif

/* ------------------------------------------------------------------------------- codes and bits */

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

/** Results of the navigation functions; the last two are places in the file, not faults. */
enum {
    FLVD_ERR_NOT_FOUND = -1,      /**< a position query or a seek failed, or 1 MiB held no plausible tag */
    FLVD_ERR_AT_FIRST_TAG = -100, /**< stepping backward reached the first tag */
    FLVD_ERR_END_OF_DATA = -101   /**< the data ended */
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

/* -------------------------------------------------------------------------------------- records */

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

/** Cached file object: one cache over one host file. Owned by whoever opened it, ended by __FLV_DMX__fioClose. */
struct fio_file_t {
    void* handle;             /**< what file_open returned */
    uint8_t* cache;           /**< capacity + overread_extra bytes */
    uint32_t head;            /**< index of the first byte not yet consumed, or not yet written out */
    uint32_t count;           /**< bytes from head on: read-ahead, or pending */
    uint32_t state;           /**< FIO_STATE_* */
    uint32_t read_size;       /**< read size: the least number of bytes that a refill asks for */
    uint32_t capacity;        /**< cache size given at open */
    int32_t overread;         /**< refill beyond the request */
    uint32_t overread_extra;  /**< extra cache bytes for it */
    int32_t bits_left;        /**< bit reader: number of valid bits in `bits` */
    uint64_t bits;            /**< bit reader: the next bits, left-aligned */
    int32_t bit_skip_pending; /**< bit reader: it consumes the next bytes itself */
};

/** Description of one tag. */
typedef struct flvd_tag_info_t {
    uint32_t type;      /**< FLVD_TAG_TYPE_* */
    uint32_t data_size; /**< DataSize, 0 to 0xFFFFFF */
    uint32_t timestamp; /**< ms; TimestampExtended is the top byte */
    uint32_t stream_id; /**< StreamID, reported and never tested */
} flvd_tag_info_t;

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
 * @param overread       non-zero: a refill asks for the whole request after the cached bytes
 * @param overread_extra extra cache bytes for that, ignored when overread is 0
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
 * Consumes n bytes. Going past the end of the file succeeds when the host's seek does.
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
 * `destination`, or through the cache when it is less than the read size.
 * @return whole elements delivered; 0, nothing moved, when `size` is 0 or size × count does not fit 32 bits
 */
FLVD_API uint32_t __FLV_DMX__fioRead(void* destination, uint32_t size, uint32_t count, fio_file_t* file);

/**
 * Writes `count` elements of `size` bytes through the cache.
 * @return whole elements accepted; 0 as for reading, and when pending bytes could not be written: they stay pending
 */
FLVD_API uint32_t __FLV_DMX__fioWrite(const void* source, uint32_t size, uint32_t count, fio_file_t* file);

/** Sets the read size; 0 means the whole cache. @return 1; 0 when `size` is above the capacity */
FLVD_API int32_t __FLV_DMX__fioSetCacheReadSize(fio_file_t* file, uint32_t size);

/** @return the read size in bytes */
FLVD_API uint32_t __FLV_DMX__fioGetCacheReadSize(fio_file_t* file);

/** Debug entry without state. @return 0 */
FLVD_API uint64_t __FLV_DMX__fiodbgReadBytes(void);
/** Debug entry without effect. */
FLVD_API void __FLV_DMX__fiodbgReset(void);

/* ----------------------------------------------------------------------------------- bit reader */

/* Reads a cached file bit by bit, most significant bit first. The byte position stays in step: a byte of which
 * one bit was consumed counts as consumed. After any byte-level access but a peek it must be started again;
 * until then bits read as 0. Bits past the end of the file read as 0. The cache must hold 8 bytes. */

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
 * @param verify 0: header test only; else the PreviousTagSize after the data must agree as well, except after a
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
 * @param file  reader; its read size is the whole cache for the time of the call
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
 *         before the first tag included
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
 * @param ctx    instance; its current reader stands on the first byte of the payload and ends after it
 * @param length bytes of the payload
 * @return 0 when at least one value was parsed; -1 when none was, and when the position cannot be taken;
 *         FLVD_ERR_END_OF_DATA when the reader could not be put after the payload
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
 * @param result    receives the timestamp of the tag reached; first_ts when the reader was put before the first
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

#endif /* FLVDMX_LAYERS_H */
