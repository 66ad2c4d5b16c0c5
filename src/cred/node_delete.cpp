// SPDX-License-Identifier: Apache-2.0
#include "ovradrnode/node_delete.h"

#include "ovradrnode/cred_utils.h"
#include "ovradrnode/node_cache.h"
#include "ovradrnode/node_db.h"
#include "words.h"

#include <ovradrcore/json.h>
#include <ovradrcore/log.h>

namespace OvraDRNode {

using OvraDRCore::LogLevel;

namespace {

bool deleteRow(const std::string &credId, const OvraDRCore::SqliteTableHandler &table) {
    const OvraDRCore::SqliteEqual condition(Word::kCredId, credId);
    if (!NodeDBHandler::GetHandler().DeleteRecord(condition.text, table)) {
        OVRA_LOG_IN(LogLevel::kErr, "DeleteRecord", "Failed to delete node with credId[%s] from db",
                    credId.c_str());
        return false;
    }
    return true;
}

/// The deletion, common to all kinds of credentials; it logs as process().
/// \param record  the credential, if there is one
template <typename Flow>
bool deleteAndRelease(const Flow &flow, const std::string &credId, const DRNode &record) {
    constexpr const char *kFunction = "process";
    if (!flow.DeleteRecord()) {
        OVRA_LOG_IN(LogLevel::kErr, kFunction, "Failed to delete record of cred[%s]",
                    credId.c_str());
        return false;
    }
    if (!CredUtils::NotifyRemoteNodeDeleteSessionIfNotUsed(record.conn, record.session)) {
        OVRA_LOG_IN(LogLevel::kWarn, kFunction, "Failed to notify remote [%s] to delete session",
                    OvraDRCore::toString(record.conn.toJson()).c_str());
    }
    return true;
}

} // namespace

DRNodeCredDelete::DRNodeCredDelete(const std::string &credId_)
    : credId(credId_) {}

bool DRNodeCredDelete::DeleteRecord() const {
    return deleteRow(credId, NodeCredSqliteTable());
}

bool DRNodeCredDelete::process() {
    if (credId.empty()) {
        OVRA_ERR("Invalid credId to delete");
        return false;
    }
    DRNode record;
    if (!DRNodeDB::GetCred(credId, record)) {
        OVRA_WARN("Failed to get cred[%s] from db", credId.c_str());
        record = DRNode(); // ignore an invalid row
    }
    if (!deleteAndRelease(*this, credId, record)) {
        return false;
    }
    NodeCache cache(record.nodeId, false);
    if (DRNodeDB::IsNodeIdExist(record.nodeId) > 0) {
        cache.Update();
    } else {
        cache.Remove();
    }
    return true;
}

TempCredDelete::TempCredDelete(const std::string &credId_)
    : credId(credId_) {}

bool TempCredDelete::DeleteRecord() const {
    return deleteRow(credId, TempCredSqliteTable());
}

bool TempCredDelete::process() {
    if (credId.empty()) {
        OVRA_ERR("Invalid credId to delete");
        return false;
    }
    DRNode record;
    if (!DRNodeDB::GetTempCred(credId, record)) {
        OVRA_WARN("Failed to get cred[%s] from db", credId.c_str());
    }
    if (!deleteAndRelease(*this, credId, record)) {
        return false;
    }
    // The other credentials still reach the node, so its cached facts stay.
    if (DRNodeDB::IsNodeIdExist(record.nodeId) <= 0) {
        NodeCache(record.nodeId, false).Remove();
    }
    return true;
}

} // namespace OvraDRNode
