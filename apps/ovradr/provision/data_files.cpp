// SPDX-License-Identifier: Apache-2.0
#include "provision/data_files.h"

#include <ovradrcore/util.h>

#include <unistd.h>

#include <cerrno>
#include <filesystem>
#include <system_error>

namespace Ovradr {

namespace {

namespace fs = std::filesystem;

constexpr const char *kDataFolder = "ovradrnode";

/// Makes `path` a link to `target`; true if it was not one before.
Expected<bool> linkTo(const std::string &target, const fs::path &path) {
    std::error_code error;
    if (fs::read_symlink(path, error) == target || fs::is_regular_file(fs::symlink_status(path))) {
        return false;
    }
    // Created aside and renamed, so that there is always a script.
    const std::string aside = path.string() + "." + std::to_string(getpid());
    unlink(aside.c_str());
    if (symlink(target.c_str(), aside.c_str()) != 0 || rename(aside.c_str(), path.c_str()) != 0) {
        const int reason = errno;
        unlink(aside.c_str());
        return fileFailure(path.string(), reason);
    }
    return true;
}

} // namespace

Expected<std::string> findDataFile(const std::string &name) {
    std::error_code error;
    const auto program = fs::read_symlink("/proc/self/exe", error);
    const auto beside = program.parent_path().parent_path() / "share" / kDataFolder / name;
    for (const fs::path &candidate : {beside, fs::path(OVRADR_DATA_DIR) / kDataFolder / name}) {
        if (access(candidate.c_str(), R_OK) == 0) {
            return candidate.string();
        }
    }
    return failure(ExitCode::kNotSetUp,
                   "A file of this program is missing: " + beside.string() + ".",
                   "Install the program again, with its data files.");
}

Expected<SetUpStep> provisionScripts() {
    if (!OvraDRCore::File::CreateDir(kScriptFolder, 0755)) {
        return fileFailure(kScriptFolder, errno);
    }
    SetUpStep step{"speed test scripts", false, kScriptFolder};
    for (const char *name : {"TestDownloadSpeed.sh", "TestSyncSpeed.sh"}) {
        const Expected<std::string> installed = findDataFile(name);
        if (!installed) {
            return Refusal(installed.error());
        }
        const Expected<bool> made = linkTo(*installed, fs::path(kScriptFolder) / name);
        if (!made) {
            return Refusal(made.error());
        }
        step.made = step.made || *made;
    }
    return step;
}

} // namespace Ovradr
