// The codes and line numbers of the failure sites, and the functions that record them.
//
// A failure is recorded where it happens, and a later one replaces it: the caller that knows more of what was attempted
// has the last word. Nothing clears a record, so only a failed call makes it meaningful.

#include "flvdmx/common/sites.h"

#include "flvdmx/common/instance.h"

#include <iterator>

int32_t g_flvd_lLastError;
int32_t g_flvd_lErrorLine;

namespace {

// Codes fit 16 bits, and so do line numbers: the table is read-only data of 6 bytes per site.
struct flvd_site_row_t {
    int16_t code;
    uint16_t line;
    uint16_t growing_line; // in a growing file; 0: same as line
};

#define FLVD_SITE(operation, name, code, line, growing_line) {code, line, growing_line},
constexpr flvd_site_row_t g_flvd_sites[] = {
    {FLVD_ERR_NONE, 0, 0},
#include "flvdmx/common/sites.def"
};
#undef FLVD_SITE
static_assert(std::size(g_flvd_sites) <= UINT8_MAX, "flvd_site_t has a byte");

int32_t FLVD_SiteLine(const flvd_site_row_t& row, bool growing)
{
    return growing && row.growing_line != 0 ? row.growing_line : row.line;
}

} // namespace

void FLVD_Record(flvd_ctx_t* ctx, flvd_site_t site)
{
    const flvd_site_row_t& row = g_flvd_sites[site];
    ctx->error = row.code;
    ctx->error_line = FLVD_SiteLine(row, FLVD_IsGrowing(ctx));
}

void FLVD_RecordGlobal(flvd_site_t site, bool growing)
{
    const flvd_site_row_t& row = g_flvd_sites[site];
    g_flvd_lLastError = row.code;
    g_flvd_lErrorLine = FLVD_SiteLine(row, growing);
}
