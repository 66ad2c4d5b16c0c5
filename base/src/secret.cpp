// SPDX-License-Identifier: Apache-2.0
#include "ovrabase/secret.h"

namespace OvraBase {

__attribute__((noinline)) void wipeStack() {
    std::array<char, std::size_t{128} * 1024> below;
    explicit_bzero(below.data(), below.size());
}

} // namespace OvraBase
