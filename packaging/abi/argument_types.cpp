// The types of arguments and results that signatures declare as void pointers or plain integers. Compiled only for the
// comparison of binary interfaces, which would not see them otherwise.
#include "flvdmx/flvdmx.h"

struct Interface {
    flvd_open_info_t openInfo;
    flvd_frame_request_t frameRequest;
    flvd_frame_t frame;
    flvd_seek_request_t seekRequest;
    decltype(FLVD_OP_OPEN) operations;
    decltype(FLVD_RET_FAILED) results;
    decltype(FLVD_OPT_USER_BUFFER) options;
    decltype(FLVD_STREAM_VIDEO) streams;
    decltype(FLVD_SEEK_NONE) seekMethods;
    decltype(FLVD_SEEK_RELATIVE) seekModes;
    decltype(FLVD_TAG_VIDEO) tagKinds;
    decltype(FLVD_TAG_TYPE_AUDIO) tagTypes;
    decltype(FLVD_AUDIO_TAG_AAC) formatTags;
    decltype(FLVD_ERR_NOT_FOUND) navigationResults;
    decltype(FLVD_ERR_NONE) errors;
    decltype(FIO_MODE_READ) openModes;
    decltype(FIO_SEEK_SET) origins;
};

FLVD_API Interface g_interface;
