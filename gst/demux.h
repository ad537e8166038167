/*
 * The element flvdmxdemux: reads FLV files in pull mode, with source pads `video` and `audio`.
 */
#pragma once

#include <gst/gst.h>

GST_ELEMENT_REGISTER_DECLARE(flvdmxdemux)
