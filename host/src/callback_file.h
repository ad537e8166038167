/* Opening files over callbacks, for the hosts that find them by a name. */
#ifndef FLVDMX_HOST_CALLBACK_FILE_H
#define FLVDMX_HOST_CALLBACK_FILE_H

#include "flvdmx/callback_host.h"

/* A handle for the functions of flvd_callback_host_fill. The record may go, name and list are not looked at. Null, with
 * errno set, for null, a mode that writes, and without memory. */
void* flvd_callback_file_open(const flvd_callback_file_t* file, const char* mode);

#endif
