/* The next frame, however many tags come before it. */
#include "flvdmx/next_frame.h"

int32_t flvd_next_frame(flvd_ctx_t* instance, const flvd_frame_request_t* request, flvd_frame_t* frame)
{
    int64_t reached = -1;
    for (;;) {
        const int32_t result = QVX_FLV_DMX(FLVD_OP_GET_FRAME, &instance, request, frame);
        if (result != FLVD_RET_END)
            return result;
        /* Without a separate audio reader, both readers are the same. */
        const int is_audio = request->stream == FLVD_STREAM_AUDIO;
        const int64_t position = __FLV_DMX__fioTell64(is_audio ? instance->audio_reader : instance->main_reader);
        if (position <= reached || position >= instance->data_end)
            return result;
        reached = position;
    }
}
