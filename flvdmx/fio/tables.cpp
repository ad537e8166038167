// The process-wide host functions. They are plain globals without a lock: opens, which alone write them, must not run
// during any other call.

#include "flvdmx/fio/tables.h"

flvd_mem_funcs_t g_flvd_memFuncs;
fio_funcs_t g_flvd_fioFuncs;

void __FLV_DMX__fioSetFunc(const fio_funcs_t* funcs)
{
    g_flvd_fioFuncs = *funcs;
}
