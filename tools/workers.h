// Work on many things side by side, in processes.
#ifndef FLVDMX_TOOLS_WORKERS_H
#define FLVDMX_TOOLS_WORKERS_H

#include <cstddef>
#include <functional>
#include <optional>
#include <string>

namespace tool {

/**
 * Does `work` for the numbers below `count` in `jobs` processes, since what a library keeps for the process is then
 * nobody else's, and hands the results in order to `take`.
 *
 * @param work  its result holds no line end and no null
 * @param take  gets nothing when the process ended too early
 */
void RunWorkers(size_t count, size_t jobs, const std::function<std::string(size_t)>& work,
                const std::function<void(size_t, const std::optional<std::string>&)>& take);

} // namespace tool

#endif
