#pragma once

#include <omp.h>

namespace TessikSDK::GeomBind {

// The binding loops run one worker per processor. They ask for it per loop (num_threads) rather than
// through omp_set_num_threads, so the host's own OpenMP setting is left as it was.
inline int processorThreads() { return omp_get_num_procs(); }

}  // namespace TessikSDK::GeomBind
