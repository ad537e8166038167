// Failure sites by name. sites.def is the only table of their codes and line numbers.
#ifndef FLVDMX_COMMON_SITES_H
#define FLVDMX_COMMON_SITES_H

#include "flvdmx/flvdmx.h"

#define FLVD_SITE(operation, name, code, line, growing_line) FLVD_SITE_##name,
enum flvd_site_t : uint8_t {
    FLVD_SITE_NONE, // success, for functions that return the site of their failure
#include "flvdmx/common/sites.def"
};
#undef FLVD_SITE

// Records the failure in the instance.
void FLVD_Record(flvd_ctx_t* ctx, flvd_site_t site);

// Records the failure in the globals, for failures without an instance.
void FLVD_RecordGlobal(flvd_site_t site, bool growing);

// Records the failure and returns -1.
inline int32_t FLVD_Fail(flvd_ctx_t* ctx, flvd_site_t site)
{
    FLVD_Record(ctx, site);
    return -1;
}

// Records the failure and returns the result for data that ends too early.
inline int32_t FLVD_FailShort(flvd_ctx_t* ctx, flvd_site_t site)
{
    FLVD_Record(ctx, site);
    return FLVD_ERR_END_OF_DATA;
}

#endif
