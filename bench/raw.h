// The baseline of every benchmark: one libpq connection and plain PQexec round trips.
#pragma once

#include <benchmark/benchmark.h>
#include <libpq-fe.h>
#include <string>

namespace bench {

// A process-wide raw connection with the same parameters as the library's.
PGconn *raw();

// Runs `sql` on the raw connection; aborts the benchmark when it fails.
void raw_exec(benchmark::State &state, const std::string &sql);

} // namespace bench
