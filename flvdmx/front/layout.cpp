// The layout of the records is part of the binary interface: programs that were compiled against an earlier header pass
// and read them by offset. All records are checked on the 32-bit target, and those that are made of pointer-sized or
// fixed-width words everywhere.
//
// An assertion that fails here means that a header has changed incompatibly. The remedy is to undo that change, or a
// new soname; these numbers never change.

#include "flvdmx/flvdmx.h"

#include <cstddef>
#include <cstdint>

namespace {

// True when the offsets are those of consecutive words of `word` bytes; the first one is word number `first`.
template <size_t N> constexpr bool FLVD_AreWords(const size_t (&offsets)[N], size_t word, size_t first = 0)
{
    for (size_t i = 0; i < N; ++i)
        if (offsets[i] != (first + i) * word)
            return false;
    return true;
}

#define AT(field) offsetof(record, field)

namespace init {
using record = flvd_init_t;
constexpr size_t g_memory[] = {AT(mem_alloc), AT(mem_free), AT(mem_slot3), AT(mem_copy),
                               AT(mem_slot5), AT(mem_set),  AT(mem_slot1), AT(unused7)};
constexpr size_t g_file[] = {AT(file_open),  AT(file_read),   AT(file_seek),   AT(file_tell),
                             AT(file_close), AT(file_eof),    AT(file_flush),  AT(file_write),
                             AT(unused24),   AT(file_seek64), AT(file_tell64), AT(unused27)};
constexpr size_t g_settings[] = {AT(file_name), AT(options), AT(cache_size), AT(scan_read_size)};
static_assert(sizeof(record) == 36 * sizeof(void*) && FLVD_AreWords(g_memory, sizeof(void*)));
static_assert(FLVD_AreWords(g_file, sizeof(void*), 16) && FLVD_AreWords(g_settings, sizeof(void*), 32));
} // namespace init

namespace open_info {
using record = flvd_open_info_t;
constexpr size_t g_words[] = {AT(file_info), AT(has_video),  AT(video_info),  AT(video_config),
                              AT(has_audio), AT(audio_info), AT(audio_config)};
static_assert(sizeof(record) == 7 * sizeof(void*) && FLVD_AreWords(g_words, sizeof(void*)));
} // namespace open_info

namespace mem_funcs {
using record = flvd_mem_funcs_t;
constexpr size_t g_slots[] = {AT(mem_free), AT(mem_alloc), AT(mem_copy), AT(mem_slot1), AT(mem_slot3), AT(mem_set)};
static_assert(sizeof(record) == 6 * sizeof(void*) && FLVD_AreWords(g_slots, sizeof(void*)));
} // namespace mem_funcs

namespace fio_funcs {
using record = fio_funcs_t;
constexpr size_t g_slots[] = {AT(mem_alloc),   AT(mem_slot1),  AT(mem_free),  AT(mem_slot3),  AT(mem_copy),
                              AT(mem_slot5),   AT(mem_set),    AT(file_open), AT(file_close), AT(file_read),
                              AT(file_write),  AT(file_seek),  AT(file_tell), AT(file_eof),   AT(file_flush),
                              AT(file_seek64), AT(file_tell64)};
static_assert(sizeof(record) == 17 * sizeof(void*) && FLVD_AreWords(g_slots, sizeof(void*)));
} // namespace fio_funcs

namespace tag_info {
using record = flvd_tag_info_t;
constexpr size_t g_words[] = {AT(type), AT(data_size), AT(timestamp), AT(stream_id)};
static_assert(sizeof(record) == 16 && FLVD_AreWords(g_words, 4));
} // namespace tag_info

namespace seek_request {
using record = flvd_seek_request_t;
constexpr size_t g_words[] = {AT(time), AT(mode)};
static_assert(sizeof(record) == 8 && FLVD_AreWords(g_words, 4));
} // namespace seek_request

// Records that mix pointers with fields of fixed width: these offsets hold for 32-bit pointers and an int64_t that is
// aligned to 8 bytes.
#if defined(__arm__)

namespace file {
using record = fio_file_t;
constexpr size_t g_words[] = {AT(handle),    AT(cache),    AT(head),     AT(count),          AT(state),
                              AT(read_size), AT(capacity), AT(overread), AT(overread_extra), AT(bits_left)};
static_assert(sizeof(record) == 56 && FLVD_AreWords(g_words, 4));
static_assert(AT(bits) == 40 && AT(bit_skip_pending) == 48);
} // namespace file

namespace file_info {
using record = flvd_file_info_t;
static_assert(sizeof(record) == 24 && AT(file_name) == 0 && AT(duration_ms) == 4);
static_assert(AT(file_size) == 8 && AT(seek_method) == 16);
} // namespace file_info

namespace video_info {
using record = flvd_video_info_t;
constexpr size_t g_words[] = {AT(reserved), AT(width),  AT(height),      AT(frame_rate),
                              AT(fourcc),   AT(config), AT(config_size), AT(last_key_time_ms)};
static_assert(sizeof(record) == 32 && FLVD_AreWords(g_words, 4));
} // namespace video_info

namespace audio_info {
using record = flvd_audio_info_t;
constexpr size_t g_words[] = {AT(reserved), AT(sample_rate), AT(sample_size), AT(channels), AT(format_tag),
                              AT(config),   AT(config_size), AT(reserved2),   AT(data_rate)};
static_assert(sizeof(record) == 36 && FLVD_AreWords(g_words, 4));
} // namespace audio_info

namespace frame_request {
using record = flvd_frame_request_t;
constexpr size_t g_words[] = {AT(buffer), AT(buffer_size), AT(stream)};
static_assert(sizeof(record) == 12 && FLVD_AreWords(g_words, 4));
} // namespace frame_request

namespace frame {
using record = flvd_frame_t;
constexpr size_t g_words[] = {AT(data), AT(size), AT(stream), AT(timestamp_ms), AT(reserved)};
static_assert(sizeof(record) == 24 && FLVD_AreWords(g_words, 4));
} // namespace frame

namespace keyframes {
using record = flvd_keyframe_arrays_t;
constexpr size_t g_words[] = {AT(times_count), AT(times_ms), AT(positions_count), AT(positions)};
static_assert(sizeof(record) == 16 && FLVD_AreWords(g_words, 4));
static_assert(sizeof(flvd_keyframe_index_t) == 24 && offsetof(flvd_keyframe_index_t, positions_offset) == 8);
static_assert(offsetof(flvd_keyframe_index_t, entry_count) == 16);
} // namespace keyframes

namespace ctx {
using record = flvd_ctx_t;
constexpr size_t g_words[] = {AT(cur_reader),  AT(main_reader),     AT(audio_reader), AT(options),
                              AT(seek_method), AT(opened_for_info), AT(frame_buffer), AT(frame_buffer_size),
                              AT(cache_size),  AT(scan_read_size),  AT(byte_rate),    AT(streams),
                              AT(file_info)};
// From word 40 on: the fields between data_end and the keyframe index.
constexpr size_t g_times[] = {
    AT(data_offset),   AT(last_frame_size), AT(last_video_ts),  AT(last_audio_ts),      AT(duration_ms),
    AT(first_ts),      AT(last_ts),         AT(audio_delay_ms), AT(video_codec_filter), AT(audio_format_filter),
    AT(keyframe_index)};
static_assert(sizeof(record) == 280 && FLVD_AreWords(g_words, 4) && FLVD_AreWords(g_times, 4, 40));
static_assert(AT(video_info) == 72 && AT(audio_info) == 104 && AT(file_size) == 144 && AT(data_end) == 152);
static_assert(AT(last_keyframe_pos) == 224 && AT(last_keyframe_ms) == 232 && AT(file_shorter_than_meta) == 236);
static_assert(AT(saved_main_pos) == 240 && AT(saved_audio_pos) == 248 && AT(keyframe_arrays) == 256);
static_assert(AT(error) == 272 && AT(error_line) == 276);
} // namespace ctx

#endif
#undef AT

} // namespace
