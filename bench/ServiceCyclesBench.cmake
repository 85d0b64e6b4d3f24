# Runs against the tavoplayerd of the build on a stream made by tsgen.
add_dependencies(${BENCH_TARGET} tavoplayerd tsgen)
