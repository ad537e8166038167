// The size of this array tells the size of the records that an open allocates beside the buffers: the instance and two
// readers. It is looked up in the object file, so that it can be had for a machine that is not this one.
#include "flvdmx/flvdmx.h"

char flvd_instance_size[sizeof(flvd_ctx_t) + 2 * sizeof(fio_file_t)];
