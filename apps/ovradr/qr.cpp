// SPDX-License-Identifier: Apache-2.0
#include "qr.h"

#include <qrencode.h>
#include <sys/ioctl.h>
#include <unistd.h>

#include <cstddef>
#include <memory>

namespace Ovradr {

namespace {

constexpr int kQuiet = 4; ///< modules around it, as ISO/IEC 18004 asks for

int terminalColumns() {
    winsize size{};
    return isatty(STDERR_FILENO) == 1 && ioctl(STDERR_FILENO, TIOCGWINSZ, &size) == 0 &&
                   size.ws_col > 0
               ? size.ws_col
               : 0;
}

} // namespace

std::string qrForTerminal(const std::string &text) {
    const std::unique_ptr<QRcode, decltype(&QRcode_free)> code(
        QRcode_encodeString(text.c_str(), 0, QR_ECLEVEL_L, QR_MODE_8, 1), &QRcode_free);
    if (!code || code->width + 2 * kQuiet > terminalColumns()) {
        return {};
    }
    const int width = code->width;
    const auto light = [&code, width](int x, int y) {
        const bool inside = x >= 0 && y >= 0 && x < width && y < width;
        const auto row = static_cast<std::size_t>(y) * static_cast<std::size_t>(width);
        return !inside || (code->data[row + static_cast<std::size_t>(x)] & 1) == 0;
    };
    // A line of text is two rows of modules: half blocks, or a module would be twice as high as
    // wide.
    std::string lines;
    for (int y = -kQuiet; y < width + kQuiet; y += 2) {
        lines += "\x1B[97;40m";
        for (int x = -kQuiet; x < width + kQuiet; ++x) {
            const bool upper = light(x, y);
            const bool lower = light(x, y + 1);
            lines += upper ? (lower ? "\u2588" : "\u2580") : (lower ? "\u2584" : " ");
        }
        lines += "\x1B[0m\n";
    }
    return lines;
}

} // namespace Ovradr
