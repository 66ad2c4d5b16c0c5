// SPDX-License-Identifier: Apache-2.0
#include "service/memory.h"

#include <ovradrcore/log.h>

#include <malloc.h>
#include <sys/prctl.h>
#include <sys/resource.h>

#include <algorithm>
#include <cstdlib>
#include <cstring>
#include <string_view>

#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
#define OVRA_OWN_FREE 0 // the sanitizers have their own
#elif defined(__has_feature)
#if __has_feature(address_sanitizer) || __has_feature(thread_sanitizer)
#define OVRA_OWN_FREE 0
#endif
#endif
#ifndef OVRA_OWN_FREE
#define OVRA_OWN_FREE 1
#endif

#if OVRA_OWN_FREE

// Replaces free(3) and realloc(3) of the whole process, its libraries included ("Replacing malloc"
// in the manual of the GNU C library), by those of that library with a wipe before.
// NOLINTBEGIN(bugprone-reserved-identifier,cppcoreguidelines-no-malloc)
extern "C" {

void __libc_free(void *block);

__attribute__((visibility("default"))) void free(void *block) noexcept {
    if (block != nullptr) {
        explicit_bzero(block, malloc_usable_size(block));
        __libc_free(block);
    }
}

__attribute__((visibility("default"))) void *realloc(void *block, std::size_t size) noexcept {
    if (block == nullptr) {
        return malloc(size);
    }
    if (size == 0) {
        free(block);
        return nullptr;
    }
    const std::size_t before = malloc_usable_size(block);
    if (size <= before && size >= before / 2) {
        return block;
    }
    void *const moved = malloc(size);
    if (moved != nullptr) {
        std::memcpy(moved, block, std::min(size, before));
        free(block);
    }
    return moved;
}

} // extern "C"
// NOLINTEND(bugprone-reserved-identifier,cppcoreguidelines-no-malloc)

#endif

namespace OvraService {

void protectMemory() {
    const char *const dumpable = std::getenv("OVRADR_DUMPABLE"); // NOLINT(concurrency-mt-unsafe)
    if (dumpable != nullptr && std::string_view(dumpable) == "1") {
        return;
    }
    const rlimit none{0, 0};
    if (prctl(PR_SET_DUMPABLE, 0) != 0 || setrlimit(RLIMIT_CORE, &none) != 0) {
        OVRA_WARN("The memory of this process cannot be kept out of cores");
    }
}

} // namespace OvraService
