/* Opens a file and lists its contents: list FILE */
#include "flvdmx/error_text.h"
#include "flvdmx/flvdmx.h"
#include "flvdmx/stdio_host.h"

#include <inttypes.h>
#include <stdio.h>

static void print_video(const flvd_video_info_t* video)
{
    const int known = video->fourcc[0] != '\0';
    printf("video    %.4s, %" PRIu32 " x %" PRIu32 ", %" PRIu32 " bytes of configuration\n",
           known ? video->fourcc : "????", video->width, video->height, video->config_size);
}

static void print_audio(const flvd_audio_info_t* audio)
{
    printf("audio    format 0x%" PRIX32 ", %" PRIu32 " Hz, %" PRIu32 " channels, %" PRIu32 " bytes of configuration\n",
           audio->format_tag, audio->sample_rate, audio->channels, audio->config_size);
}

static void print_file(const flvd_file_info_t* file)
{
    static const char* const methods[] = {"not seekable", "seekable by index", "seekable by scanning"};
    printf("file     %s, %" PRId64 " bytes\n", file->file_name, file->file_size);
    printf("duration %" PRIu32 " ms, %s\n", file->duration_ms, methods[file->seek_method]);
}

int main(int argc, char** argv)
{
    flvd_init_t init;
    flvd_ctx_t* instance = NULL;
    flvd_open_info_t info;

    if (argc != 2) {
        fprintf(stderr, "usage: list FILE\n");
        return 2;
    }
    flvd_stdio_host_fill(&init);
    init.file_name = argv[1]; /* must stay valid until the file is closed, as argv does */
    if (QVX_FLV_DMX(FLVD_OP_OPEN, &instance, &init, &info) != 0) {
        fprintf(stderr, "list: %s: %s (line %" PRId32 ")\n", argv[1], flvd_error_text(g_flvd_lLastError),
                g_flvd_lErrorLine);
        return 1;
    }
    print_file(info.file_info);
    if (info.has_video)
        print_video(info.video_info);
    if (info.has_audio)
        print_audio(info.audio_info);
    QVX_FLV_DMX(FLVD_OP_CLOSE, &instance, NULL, NULL);
    return 0;
}
