// The process-wide copies of the host's tables. Every open overwrites them; everything else only calls through them.
#ifndef FLVDMX_FIO_TABLES_H
#define FLVDMX_FIO_TABLES_H

#include "flvdmx/flvdmx.h"

extern flvd_mem_funcs_t g_flvd_memFuncs; // instance memory: the instance, frame buffers, codec configurations
extern fio_funcs_t g_flvd_fioFuncs;      // the cached files

#endif
