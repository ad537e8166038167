/* The contents of tests/data: sample files with their expected results, as make_expected.py writes them, and tables. */
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

/** What the prober reports about a packet and its tag does not contain. */
struct ExpectedPacket {
    uint32_t presentation = 0; /**< ms */
    bool keyframe = false;     /**< always true for audio */
};

/** A sample file. Its tags are those that carry the packets; both have been compared. */
struct Expected : Flv {
    std::string name;
    std::vector<ExpectedStream> streams;
    std::vector<ExpectedPacket> packets; /**< one per tag */
};

/** The CRC-32 of zlib and Ethernet. */
uint32_t Crc32(const Bytes& bytes);

/** Reads NAME.flv and expected/NAME.txt in FLVDMX_TEST_DATA. Throws if they cannot be read or do not agree. */
Expected ReadExpected(const std::string& name);

/** The rows of a table, split at " | ". Skips empty lines and lines that start with #. Throws if there are no rows. */
std::vector<std::vector<std::string>> ReadTable(const std::string& name);

} // namespace flvd_test
