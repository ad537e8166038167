// Places of failure by name. sites.def is the one table of their codes and lines.
#ifndef FLVDMX_COMMON_SITES_H
#define FLVDMX_COMMON_SITES_H

#include "flvdmx/flvdmx.h"

#define FLVD_SITE(operation, name, code, line, growing_line) FLVD_SITE_##name,
enum flvd_site_t : uint8_t {
    FLVD_SITE_NONE, // for functions that return where they failed: nowhere
#include "flvdmx/common/sites.def"
};
#undef FLVD_SITE

// Records where an operation on the instance failed.
void FLVD_Record(flvd_ctx_t* ctx, flvd_site_t site);

// Records it where there is no instance to be read later.
void FLVD_RecordGlobal(flvd_site_t site, bool growing);

// Records and returns the general failure.
inline int32_t FLVD_Fail(flvd_ctx_t* ctx, flvd_site_t site)
{
    FLVD_Record(ctx, site);
    return -1;
}

// Records data cut short and returns it as a place in the file.
inline int32_t FLVD_FailShort(flvd_ctx_t* ctx, flvd_site_t site)
{
    FLVD_Record(ctx, site);
    return FLVD_ERR_END_OF_DATA;
}

#endif
