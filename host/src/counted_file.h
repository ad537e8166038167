/* What the read-only hosts have in common: the file position is a number that the host keeps itself. */
#ifndef FLVDMX_HOST_COUNTED_FILE_H
#define FLVDMX_HOST_COUNTED_FILE_H

#include "flvdmx/flvdmx.h"

#include <stdbool.h>
#include <stdint.h>

/* The first member of every handle. */
typedef struct counted_file_t {
    int64_t (*size)(void* handle); /* current size of the file in bytes; negative on failure */
    int64_t position;              /* as the library sees it; never negative */
    bool end;                      /* a read reached the end of the file and no seek followed */
} counted_file_t;

/* True for a read-only mode of fopen. */
bool flvd_counted_only_reads(const char* mode);

/* Clears the block and sets all functions in it except open, read and close. Writes return 0. */
void flvd_counted_fill(flvd_init_t* init);

#endif
