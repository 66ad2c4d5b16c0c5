// SPDX-License-Identifier: Apache-2.0

// Key-value files and programs with a pipe: real implementations.

#include "stand_in.h"

#include <ovracore/ovracore.h>

#include <sys/wait.h>
#include <unistd.h>

#include <cstdarg>
#include <fstream>

using OvraVendor::coreLibrary;

namespace {

std::vector<std::string> linesOf(const char *path) {
    std::ifstream file(path);
    std::vector<std::string> lines;
    for (std::string line; std::getline(file, line);) {
        lines.push_back(line);
    }
    return lines;
}

std::map<FILE *, pid_t> programs;

} // namespace

extern "C" {

int OLIBCFileExist(const char *path) {
    return access(path, F_OK) == 0 ? 1 : 0;
}

int OLIBCFileGetKeyValue(const char *path, const char *key, char *buffer, int size, int /*flag*/) {
    const std::string start = std::string(key) + "=\"";
    for (const std::string &line : linesOf(path)) {
        if (line.starts_with(start) &&
            line.size() - start.size() <= static_cast<std::size_t>(size)) {
            const std::string value = line.substr(start.size(), line.size() - start.size() - 1);
            return std::snprintf(buffer, value.size() + 1, "%s", value.c_str());
        }
    }
    return -1;
}

int OLIBCFileSetKeyValue(const char *path, const char *key, const char *value,
                         const char * /*format*/) {
    const std::string start = std::string(key) + "=\"";
    std::vector<std::string> lines = linesOf(path);
    std::erase_if(lines, [&start](const std::string &line) { return line.starts_with(start); });
    lines.push_back(start + value + "\"");
    std::ofstream file(coreLibrary.readOnly ? "/" : path);
    for (const std::string &each : lines) {
        file << each << '\n';
    }
    return file.flush() ? 0 : -1;
}

FILE *OLIBCPopen(const char *path, const char *mode, ...) {
    std::vector<char *> arguments{const_cast<char *>(path)};
    va_list list;
    va_start(list, mode);
    while (arguments.back() != nullptr) {
        arguments.push_back(va_arg(list, char *));
    }
    va_end(list);
    int ends[2];
    if (access(path, X_OK) != 0 || pipe(ends) != 0) {
        return nullptr;
    }
    const pid_t child = fork();
    if (child == 0) {
        dup2(ends[1], STDOUT_FILENO);
        close(ends[0]);
        close(ends[1]);
        execv(path, arguments.data());
        _exit(127);
    }
    close(ends[1]);
    FILE *stream = fdopen(ends[0], mode);
    programs[stream] = child;
    ++coreLibrary.streams;
    return stream;
}

int OLIBCPclose(FILE *stream) {
    const pid_t child = programs.at(stream);
    programs.erase(stream);
    --coreLibrary.streams;
    fclose(stream);
    int status = -1;
    return waitpid(child, &status, 0) == child ? status : -1;
}
}
