// SPDX-License-Identifier: Apache-2.0
#include "ovrabase/expected.h"

#include <cerrno>
#include <system_error>

namespace OvraBase {

std::string errnoText(int number) {
    return std::generic_category().message(number);
}

Unexpected systemError(int number) {
    return Unexpected({errnoText(number), number});
}

Unexpected lastSystemError() {
    return systemError(errno);
}

} // namespace OvraBase
