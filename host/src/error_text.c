/* Names and texts of the error codes. */
#include "flvdmx/error_text.h"

typedef struct error_text_t {
    int32_t code;
    const char* name;
    const char* text;
} error_text_t;

/* All codes that can be recorded. The last row stands for every other number. */
static const error_text_t texts[] = {
    {FLVD_ERR_NONE, "FLVD_ERR_NONE", "no error was recorded"},
    {FLVD_ERR_POSITION, "FLVD_ERR_POSITION", "the position in the file could not be determined"},
    {FLVD_ERR_SEEK, "FLVD_ERR_SEEK", "seeking in the file failed"},
    {FLVD_ERR_NO_MEMORY, "FLVD_ERR_NO_MEMORY", "out of memory for the codec configuration, or it is too short"},
    {FLVD_ERR_INSTANCE_MEMORY, "FLVD_ERR_INSTANCE_MEMORY", "out of memory"},
    {FLVD_ERR_OPEN_MAIN, "FLVD_ERR_OPEN_MAIN", "the file cannot be opened"},
    {FLVD_ERR_OPEN_AUDIO, "FLVD_ERR_OPEN_AUDIO", "the file cannot be opened a second time, for its audio"},
    {FLVD_ERR_FRAME_BUFFER, "FLVD_ERR_FRAME_BUFFER", "out of memory for the frame buffer"},
    {FLVD_ERR_NO_STREAM, "FLVD_ERR_NO_STREAM", "no video or audio stream was found"},
    {FLVD_ERR_FILE_HEADER, "FLVD_ERR_FILE_HEADER", "no valid FLV file header was found"},
    {FLVD_ERR_EXTENT, "FLVD_ERR_EXTENT", "the end of the valid data was not found"},
    {FLVD_ERR_FRAME_SEEK, "FLVD_ERR_FRAME_SEEK", "the seek found no tag to land on"},
    {FLVD_ERR_SEEK_MISS, "FLVD_ERR_SEEK_MISS", "the target is beyond the end, or no keyframe is in that direction"},
    {FLVD_ERR_SEEK_PLACE, "FLVD_ERR_SEEK_PLACE", "the seek did not land on the expected tag"},
    {FLVD_ERR_INDEX_ELEMENT, "FLVD_ERR_INDEX_ELEMENT", "the keyframe index contains a value that is not a number"},
    {FLVD_ERR_AVC_CONFIG, "FLVD_ERR_AVC_CONFIG", "the AVC configuration is damaged"},
    {FLVD_ERR_VIDEO_HEADER, "FLVD_ERR_VIDEO_HEADER", "the header of the video data is damaged or not supported"},
    {FLVD_ERR_AUDIO_HEADER, "FLVD_ERR_AUDIO_HEADER", "the header of the audio data is damaged or not supported"},
    {FLVD_ERR_AVC_NO_SEQ_HEADER, "FLVD_ERR_AVC_NO_SEQ_HEADER", "the AVC stream does not start with its configuration"},
    {FLVD_ERR_NO_INSTANCE, "FLVD_ERR_NO_INSTANCE", "no file is open"},
    {FLVD_ERR_NO_VIDEO, "FLVD_ERR_NO_VIDEO", "the file has no video stream"},
    {FLVD_ERR_NO_AUDIO, "FLVD_ERR_NO_AUDIO", "the file has no audio stream"},
    {FLVD_ERR_BAD_STREAM, "FLVD_ERR_BAD_STREAM", "with a separate audio reader, a frame request must name a stream"},
    {FLVD_ERR_RESERVED_OP, "FLVD_ERR_RESERVED_OP", "the operation is reserved"},
    {FLVD_ERR_INFO_ONLY, "FLVD_ERR_INFO_ONLY", "the file was opened for information only"},
    {FLVD_ERR_NO_TAG, "FLVD_ERR_NO_TAG", "no valid tag was found"},
    {FLVD_ERR_SHORT_DATA, "FLVD_ERR_SHORT_DATA", "the end of the data was reached"},
    {FLVD_ERR_NOT_SEEKABLE, "FLVD_ERR_NOT_SEEKABLE",
     "the file is not seekable; a growing file needs video and a keyframe index"},
    {FLVD_ERR_HOST_IN_USE, "FLVD_ERR_HOST_IN_USE", "a file opened with other host functions is still open"},
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
