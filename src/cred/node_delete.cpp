// SPDX-License-Identifier: Apache-2.0
#include "ovradrnode/node_delete.h"

#include "ovradrnode/cred_utils.h"
#include "ovradrnode/node_cache.h"
#include "ovradrnode/node_db.h"
#include "words.h"

#include <ovradrcore/json.h>
#include <ovradrcore/log.h>

namespace OvraDRNode {

DRNodeCredDelete::DRNodeCredDelete(const std::string &credId_)
    : credId(credId_) {}

bool DRNodeCredDelete::DeleteRecord() const {
    const OvraDRCore::SqliteEqual condition(Word::kCredId, credId);
    if (!NodeDBHandler::GetHandler().DeleteRecord(condition.text, NodeCredSqliteTable())) {
        OVRA_ERR("Failed to delete node with credId[%s] from db", credId.c_str());
        return false;
    }
    return true;
}

bool DRNodeCredDelete::process() {
    if (credId.empty()) {
        OVRA_ERR("Invalid credId to delete");
        return false;
    }
    DRNode record;
    if (!DRNodeDB::GetCred(credId, record)) {
        OVRA_WARN("Failed to get cred[%s] from db", credId.c_str());
        record = DRNode(); // nothing of a row that is not a valid one
    }
    if (!DeleteRecord()) {
        OVRA_ERR("Failed to delete record of cred[%s]", credId.c_str());
        return false;
    }
    if (!CredUtils::NotifyRemoteNodeDeleteSessionIfNotUsed(record.conn, record.session)) {
        OVRA_WARN("Failed to notify remote [%s] to delete session",
                  OvraDRCore::toString(record.conn.toJson()).c_str());
    }
    NodeCache cache(record.nodeId, false);
    if (DRNodeDB::IsNodeIdExist(record.nodeId) > 0) {
        cache.Update();
    } else {
        cache.Remove();
    }
    return true;
}

} // namespace OvraDRNode
