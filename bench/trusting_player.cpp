#include "player.h"

#include <array>
#include <cstdio>
#include <vector>

namespace flvd_bench {
namespace {

constexpr size_t FILE_HEADER = 13, TAG_HEADER = 11, BACK_POINTER = 4;
constexpr uint32_t LARGEST_TAG = 0xFFFFFF;
constexpr uint8_t TYPE_AUDIO = 8, TYPE_VIDEO = 9, AAC = 10, AVC = 7;

struct CloseFile {
    void operator()(FILE* file) const { std::fclose(file); }
};

class TrustingPlayer : public Player {
public:
    bool open(const std::string& path) override
    {
        m_file.reset(std::fopen(path.c_str(), "rb"));
        std::array<uint8_t, FILE_HEADER> header{};
        return m_file != nullptr && take(header.data(), header.size());
    }
    void close() override { m_file.reset(); }
    uint32_t seek(int32_t) override { return 0; }

    Tally play() override
    {
        Tally tally;
        std::array<uint8_t, TAG_HEADER> header{};
        std::array<uint8_t, BACK_POINTER> back{};
        while (take(header.data(), header.size())) {
            const uint32_t size = uint32_t{header[1]} << 16 | uint32_t{header[2]} << 8 | header[3];
            if (!take(m_data.data(), size) || !take(back.data(), back.size()))
                break;
            count(tally, header[0], size);
        }
        return tally;
    }

private:
    bool take(uint8_t* to, size_t size) { return std::fread(to, 1, size, m_file.get()) == size; }

    /** Frames as a demuxer counts them: without codec header bytes and configurations. */
    void count(Tally& tally, uint8_t type, uint32_t size) const
    {
        if (type == TYPE_AUDIO && m_data[0] >> 4 == AAC && m_data[1] == 1)
            tally.add(size - 2);
        else if (type == TYPE_VIDEO && (m_data[0] & 15) == AVC && m_data[1] == 1)
            tally.add(size - 5);
    }

    std::unique_ptr<FILE, CloseFile> m_file;
    std::vector<uint8_t> m_data = std::vector<uint8_t>(LARGEST_TAG);
};

} // namespace

PlayerPtr MakeTrustingPlayer()
{
    return std::make_unique<TrustingPlayer>();
}

} // namespace flvd_bench
