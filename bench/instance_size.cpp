// The size of this array is that of the records that an open allocates in addition to the buffers: the instance and two
// readers. It is read from the object file, so that it is available for cross builds too.
#include "flvdmx/flvdmx.h"

char flvd_instance_size[sizeof(flvd_ctx_t) + 2 * sizeof(fio_file_t)];
