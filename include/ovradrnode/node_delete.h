// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovradrnode/export.h"

#include <string>

namespace OvraDRNode {

/// Deletes a node credential: first the row, then, if no other credential uses it, the session on
/// the remote node. A remote node that does not answer never blocks the deletion; it keeps the
/// session. Takes no lock, see CredCreate.
class OVRADRNODE_EXPORT DRNodeCredDelete {
public:
    explicit DRNodeCredDelete(const std::string &credId);

    [[nodiscard]] bool DeleteRecord() const;
    /// \return whether the row is gone; nothing else decides.
    [[nodiscard]] bool process();

private:
    std::string credId;
};

/// The same for a temporary credential. Its session is released too unless a node credential uses
/// it; cached facts about the node stay while there is another credential for it.
class OVRADRNODE_EXPORT TempCredDelete {
public:
    explicit TempCredDelete(const std::string &credId);

    [[nodiscard]] bool DeleteRecord() const;
    /// \return whether the row is gone; nothing else decides.
    [[nodiscard]] bool process();

private:
    std::string credId;
};

} // namespace OvraDRNode
