/* Opens files on callbacks, for the hosts that find them by name. */
#ifndef FLVDMX_HOST_CALLBACK_FILE_H
#define FLVDMX_HOST_CALLBACK_FILE_H

#include "flvdmx/callback_host.h"

/* Returns a handle for the functions of flvd_callback_host_fill. Uses only the callbacks and the user pointer of the
 * record, which need not outlive the call. Null, with errno set, when `file` is null (ENOENT), the mode writes (EACCES)
 * or there is no memory (ENOMEM). */
void* flvd_callback_file_open(const flvd_callback_file_t* file, const char* mode);

#endif
