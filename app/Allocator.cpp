// What jemalloc reads at the program's start, by this name. Linked where the service has that allocator.
extern "C" {
// NOLINTBEGIN(readability-identifier-naming)
extern const char* malloc_conf;
// Few threads allocate, and at rest each arena costs memory.
const char* malloc_conf = "narenas:2,dirty_decay_ms:1000";
// NOLINTEND(readability-identifier-naming)
}
