// SPDX-License-Identifier: Apache-2.0
#include "access.h"

#include "provision/node_database.h"

#include <ovraplatform/appliance.h>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <string>
#include <utility>

namespace Ovradr {

Expected<void> checkUser() {
    for (const std::string &path : {nodeDatabasePath(), std::string(OvraPlatform::kTlsKeyFile),
                                    std::string(OvraPlatform::kStateDir)}) {
        if (faccessat(AT_FDCWD, path.c_str(), R_OK, AT_EACCESS) != 0 && errno == EACCES) {
            return failure(ExitCode::kNotSetUp, path + " cannot be read by this user.",
                           "Run the command as root.");
        }
    }
    return {};
}

bool isOwnUser() {
    struct stat status {};
    return geteuid() == 0 ||
           (stat(OvraPlatform::kConfigDir, &status) == 0 && status.st_uid == geteuid());
}

Command forOwnUser(Command command) {
    return [command = std::move(command)] { return checkUser().and_then(command); };
}

} // namespace Ovradr
