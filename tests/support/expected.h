/* Expected results of the sample files, as tests/data/make_expected.py writes them. */
#pragma once

#include "flv_writer.h"

namespace flvd_test {

/** A whole file of tests/data; throws when it cannot be read. FLVDMX_TEST_DATA names the directory. */
Bytes ReadSample(const std::string& name);

struct ExpectedStream {
    uint32_t stream = 0; /**< 1 video, 2 audio */
    uint32_t width = 0, sample_rate = 0;
    Bytes extradata;
};

struct ExpectedPacket {
    uint32_t stream = 0;
    int64_t pos = 0;        /**< of the tag */
    uint32_t timestamp = 0; /**< of the tag, ms */
    uint32_t size = 0;
    uint32_t crc = 0;
};
/** Compares all that a delivered frame shows when the first timestamp is 0: stream, timestamp, size, CRC-32. */
bool SameFrame(const ExpectedPacket& packet, const Frame& frame);

struct Expected {
    int64_t file_size = 0;
    std::vector<ExpectedStream> streams;
    std::vector<ExpectedPacket> packets; /**< in file order */
};

/** expected/NAME.txt; throws when it cannot be read. */
Expected ReadExpected(const std::string& name);

} // namespace flvd_test
