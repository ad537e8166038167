/* Names and texts of the error codes. */
#include "flvdmx/error_text.h"

typedef struct error_text_t {
    int32_t code;
    const char* name;
    const char* text;
} error_text_t;

/* Every code that can be recorded; the last row stands for all other numbers. */
static const error_text_t texts[] = {
    {FLVD_ERR_NONE, "FLVD_ERR_NONE", "no error, or a frame that did not fit was passed over"},
    {FLVD_ERR_POSITION, "FLVD_ERR_POSITION", "the position in the file cannot be told"},
    {FLVD_ERR_SEEK, "FLVD_ERR_SEEK", "seeking in the file failed"},
    {FLVD_ERR_NO_MEMORY, "FLVD_ERR_NO_MEMORY", "no memory for the codec configuration, or it is too short"},
    {FLVD_ERR_INSTANCE_MEMORY, "FLVD_ERR_INSTANCE_MEMORY", "no memory"},
    {FLVD_ERR_OPEN_MAIN, "FLVD_ERR_OPEN_MAIN", "the file cannot be opened"},
    {FLVD_ERR_OPEN_AUDIO, "FLVD_ERR_OPEN_AUDIO", "the file cannot be opened a second time, for its audio"},
    {FLVD_ERR_FRAME_BUFFER, "FLVD_ERR_FRAME_BUFFER", "no memory for the frame buffer"},
    {FLVD_ERR_NO_STREAM, "FLVD_ERR_NO_STREAM", "neither a video nor an audio stream was found"},
    {FLVD_ERR_FILE_HEADER, "FLVD_ERR_FILE_HEADER", "no FLV file header"},
    {FLVD_ERR_EXTENT, "FLVD_ERR_EXTENT", "the end of the valid data was not found"},
    {FLVD_ERR_FRAME_SEEK, "FLVD_ERR_FRAME_SEEK", "no tag was found to land on"},
    {FLVD_ERR_SEEK_MISS, "FLVD_ERR_SEEK_MISS", "the target is beyond the end, or no keyframe lies in that direction"},
    {FLVD_ERR_SEEK_PLACE, "FLVD_ERR_SEEK_PLACE", "the tag at the place sought is not the one expected"},
    {FLVD_ERR_INDEX_ELEMENT, "FLVD_ERR_INDEX_ELEMENT", "the keyframe index holds something that is not a number"},
    {FLVD_ERR_AVC_CONFIG, "FLVD_ERR_AVC_CONFIG", "the AVC configuration is damaged"},
    {FLVD_ERR_VIDEO_HEADER, "FLVD_ERR_VIDEO_HEADER", "the video's own header was not understood"},
    {FLVD_ERR_AUDIO_HEADER, "FLVD_ERR_AUDIO_HEADER", "the audio's own header was not understood"},
    {FLVD_ERR_AVC_NO_SEQ_HEADER, "FLVD_ERR_AVC_NO_SEQ_HEADER", "the AVC stream does not begin with its configuration"},
    {FLVD_ERR_NO_INSTANCE, "FLVD_ERR_NO_INSTANCE", "no file is open"},
    {FLVD_ERR_NO_VIDEO, "FLVD_ERR_NO_VIDEO", "the file has no video stream"},
    {FLVD_ERR_NO_AUDIO, "FLVD_ERR_NO_AUDIO", "the file has no audio stream"},
    {FLVD_ERR_BAD_STREAM, "FLVD_ERR_BAD_STREAM", "with a separate audio reader a stream must be named"},
    {FLVD_ERR_RESERVED_OP, "FLVD_ERR_RESERVED_OP", "the operation is reserved"},
    {FLVD_ERR_INFO_ONLY, "FLVD_ERR_INFO_ONLY", "the file was opened for information only"},
    {FLVD_ERR_NO_TAG, "FLVD_ERR_NO_TAG", "no valid tag was found"},
    {FLVD_ERR_SHORT_DATA, "FLVD_ERR_SHORT_DATA", "the data ended"},
    {FLVD_ERR_NOT_SEEKABLE, "FLVD_ERR_NOT_SEEKABLE",
     "the file cannot be seeked in: it has no usable keyframe index and cannot be scanned"},
    {FLVD_ERR_HOST_IN_USE, "FLVD_ERR_HOST_IN_USE", "a file that was opened through another host is still open"},
    {FLVD_ERR_HOST_INCOMPLETE, "FLVD_ERR_HOST_INCOMPLETE", "the host lacks a function that the library calls"},
    {0, "unknown", "unknown error"},
};

static const error_text_t* find(int32_t code)
{
    const error_text_t* const unknown = texts + sizeof texts / sizeof *texts - 1;
    const error_text_t* row = texts;
    while (row != unknown && row->code != code)
        ++row;
    return row;
}

const char* flvd_error_name(int32_t code)
{
    return find(code)->name;
}

const char* flvd_error_text(int32_t code)
{
    return find(code)->text;
}
