// Process-wide copies of the host's function tables. Every open overwrites them; other code only calls through them.
#ifndef FLVDMX_FIO_TABLES_H
#define FLVDMX_FIO_TABLES_H

#include "flvdmx/flvdmx.h"

extern flvd_mem_funcs_t g_flvd_memFuncs; // for the instance, frame buffers and codec configurations
extern fio_funcs_t g_flvd_fioFuncs;      // for cached files

#endif
