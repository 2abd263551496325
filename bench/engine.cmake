# Boosted-tree engine benchmarks: scoring (interleaved against one tree after
# another), predict on a feature map, and model load.
add_executable(engine_bench engine_bench.cc)
target_link_libraries(engine_bench PRIVATE gbdt benchmark::benchmark)
