/* What tests/data holds: sample files with their expected results, as make_expected.py writes them, and tables. */
#pragma once

#include "flv_writer.h"

namespace flvd_test {

struct ExpectedStream {
    uint32_t stream = 0; /**< 1 video, 2 audio */
    std::string codec;   /**< the prober's name */
    uint32_t width = 0, sample_rate = 0;
    Bytes extradata;
};

/** What the prober tells of a packet beside what its tag does. */
struct ExpectedPacket {
    uint32_t presentation = 0; /**< ms */
    bool keyframe = false;     /**< of audio always */
};

/** A sample file; its tags are those that carry the packets, which have been compared with them. */
struct Expected : Flv {
    std::string name;
    std::vector<ExpectedStream> streams;
    std::vector<ExpectedPacket> packets; /**< one per tag */
};

/** NAME.flv and expected/NAME.txt in FLVDMX_TEST_DATA; throws when they cannot be read or do not agree. */
Expected ReadExpected(const std::string& name);

/** The rows of a table, split at " | "; empty lines and lines that begin with # are none. Throws without any row. */
std::vector<std::vector<std::string>> ReadTable(const std::string& name);

} // namespace flvd_test
