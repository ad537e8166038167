/*
 * Copies the frames of one stream to a file, one after the other: copy_frames FILE video|audio OUTPUT
 *
 * The output consists of bare frames: an MP3 stream can be played, AAC and AVC also need their configuration.
 */
#include "flvdmx/error_text.h"
#include "flvdmx/flvdmx.h"
#include "flvdmx/next_frame.h"
#include "flvdmx/posix_host.h"

#include <inttypes.h>
#include <stdio.h>
#include <string.h>

/* Copies up to the end of the data. Returns 0, or -1 after printing a message. */
static int copy_stream(flvd_ctx_t* instance, uint32_t stream, FILE* output)
{
    const flvd_frame_request_t request = {NULL, 0, 0}; /* the next frame of any stream: the file has one reader */
    flvd_frame_t frame;
    unsigned long frames = 0;
    unsigned long bytes = 0;
    int32_t result;

    while ((result = flvd_next_frame(instance, &request, &frame)) == 0) {
        if (frame.stream != stream)
            continue;
        if (fwrite(frame.data, 1, frame.size, output) != frame.size) {
            perror("copy_frames");
            return -1;
        }
        ++frames;
        bytes += frame.size;
    }
    printf("%lu frames, %lu bytes\n", frames, bytes);
    if (result == FLVD_RET_END)
        return 0;
    fprintf(stderr, "copy_frames: %s (line %" PRId32 ")\n", flvd_error_text(instance->error), instance->error_line);
    return -1;
}

int main(int argc, char** argv)
{
    flvd_init_t init;
    flvd_ctx_t* instance = NULL;
    flvd_open_info_t info;
    FILE* output;
    uint32_t stream;
    int failed;

    if (argc != 4 || (strcmp(argv[2], "video") != 0 && strcmp(argv[2], "audio") != 0)) {
        fprintf(stderr, "usage: copy_frames FILE video|audio OUTPUT\n");
        return 2;
    }
    stream = strcmp(argv[2], "video") == 0 ? FLVD_STREAM_VIDEO : FLVD_STREAM_AUDIO;
    flvd_posix_host_fill(&init); /* the fastest host for playing a complete file */
    init.file_name = argv[1];
    if (QVX_FLV_DMX(FLVD_OP_OPEN, &instance, &init, &info) != 0) {
        fprintf(stderr, "copy_frames: %s: %s (line %" PRId32 ")\n", argv[1], flvd_error_text(g_flvd_lLastError),
                g_flvd_lErrorLine);
        return 1;
    }
    output = fopen(argv[3], "wb");
    if (output == NULL)
        perror(argv[3]);
    failed = output == NULL || copy_stream(instance, stream, output) != 0;
    if (output != NULL && fclose(output) != 0) {
        perror(argv[3]);
        failed = 1;
    }
    QVX_FLV_DMX(FLVD_OP_CLOSE, &instance, NULL, NULL);
    return failed;
}
