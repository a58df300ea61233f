// Which processors the calling thread, and the threads and processes that it starts, may use. What a wake-up costs
// depends more on whether it crosses to another processor than on anything that is measured here, and the scheduler
// chooses by what else runs: so the measurements choose. Back to what it was with the end of the object.
#pragma once

#include <cstdint>
#include <sched.h>

namespace vela::ipcbench {

enum class Places : std::uint8_t {
    Free,     ///< by the scheduler
    Together, ///< clients and server on one processor
    Apart,    ///< clients on one processor, the server on the others
};

class Placement {
public:
    explicit Placement(Places places);
    Placement(const Placement&) = delete;
    Placement& operator=(const Placement&) = delete;
    ~Placement() { apply(usable_); }

    void serverStarts() const { apply(places_ == Places::Together ? first_ : others_); }
    void clientsStart() const { apply(places_ == Places::Free ? usable_ : first_); }

private:
    static void apply(const cpu_set_t& processors) { sched_setaffinity(0, sizeof(processors), &processors); }

    const Places places_;
    cpu_set_t usable_;
    cpu_set_t first_;
    cpu_set_t others_;
};

inline Placement::Placement(Places places) : places_(places) {
    CPU_ZERO(&first_);
    sched_getaffinity(0, sizeof(usable_), &usable_);
    others_ = usable_;
    if (places == Places::Free || CPU_COUNT(&usable_) == 1) {
        return;
    }
    std::size_t processor = 0;
    while (!CPU_ISSET(processor, &usable_)) {
        ++processor;
    }
    CPU_SET(processor, &first_);
    CPU_CLR(processor, &others_);
}

} // namespace vela::ipcbench
