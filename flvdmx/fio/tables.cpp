#include "flvdmx/fio/tables.h"

flvd_mem_funcs_t g_flvd_memFuncs;
fio_funcs_t g_flvd_fioFuncs;

void __FLV_DMX__fioSetFunc(const fio_funcs_t* funcs)
{
    g_flvd_fioFuncs = *funcs;
}
