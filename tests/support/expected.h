/* What tests/data holds: sample files with their expected results, as make_expected.py writes them, and tables. */
#pragma once

#include "flv_writer.h"

namespace flvd_test {

inline const std::string g_samples[] = {"aac_only", "avc_aac",    "avc_aac_index", "avc_bframes_aac",
                                        "avc_only", "h263_mp3",   "mp3_only",      "pcm_only",
                                        "screen",   "speex_only", "truncated",     "damaged"};

struct ExpectedStream {
    uint32_t stream = 0; /**< 1 video, 2 audio */
    std::string codec;   /**< the prober's name */
    uint32_t width = 0, sample_rate = 0;
    Bytes extradata;
};

/** What the prober reports of a packet and its tag does not say. */
struct ExpectedPacket {
    uint32_t presentation = 0; /**< ms */
    bool keyframe = false;     /**< always true for audio */
};

/** A sample file; its tags are those that carry the packets, which have been compared with them. */
struct Expected : Flv {
    std::string name;
    std::vector<ExpectedStream> streams;
    std::vector<ExpectedPacket> packets; /**< one per tag */
};

/** As zlib and Ethernet use it. */
uint32_t Crc32(const Bytes& bytes);

/** NAME.flv and expected/NAME.txt in FLVDMX_TEST_DATA; throws when they cannot be read or do not agree. */
Expected ReadExpected(const std::string& name);

/** The rows of a table, split at " | ". Skips empty lines and lines that start with #. Throws if there are no rows. */
std::vector<std::vector<std::string>> ReadTable(const std::string& name);

} // namespace flvd_test
