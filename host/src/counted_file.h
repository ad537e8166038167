/* What the hosts for reading have in common: files whose position is a number that the host keeps itself. */
#ifndef FLVDMX_HOST_COUNTED_FILE_H
#define FLVDMX_HOST_COUNTED_FILE_H

#include "flvdmx/flvdmx.h"

#include <stdbool.h>
#include <stdint.h>

/* The beginning of every handle. */
typedef struct counted_file_t {
    int64_t (*size)(void* handle); /* bytes of the file now; negative: cannot be told */
    int64_t position;              /* what the library sees; never negative */
    bool end;                      /* a read met the end of the file and no seek followed */
} counted_file_t;

/* True for a mode of fopen that only reads. */
bool flvd_counted_only_reads(const char* mode);

/* Clears the block and puts all functions into it but those that open, read and close. Writes take nothing. */
void flvd_counted_fill(flvd_init_t* init);

#endif
