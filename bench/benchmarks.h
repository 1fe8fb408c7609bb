// SPDX-License-Identifier: Apache-2.0
// The groups of benchmarks. Each registers its own.
#ifndef VELD_BENCH_BENCHMARKS_H
#define VELD_BENCH_BENCHMARKS_H

#include "diskDirectory.h"
#include "pairedMeasurement.h"

namespace veldbench {

/// Running command lists.
void registerCommandBenchmarks(const Scale &scale);
/// Translating rules into commands.
void registerTranslationBenchmarks(const Scale &scale);
/// Reading profiles, and queries on them.
void registerStoreBenchmarks(const Scale &scale);
/// Waiting for locks.
void registerLockBenchmarks(const Scale &scale);
/// Edits of all profiles. `disk` may be unavailable: then only memory is written.
void registerEditBenchmarks(const Scale &scale, const DiskDirectory &disk);

}  // namespace veldbench

#endif
