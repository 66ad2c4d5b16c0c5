// SPDX-License-Identifier: Apache-2.0
#pragma once

/// Every path of the library. All processes on the appliance use the doubled slash and the spelling
/// "premission".
namespace OvraDRNode::Path {

inline constexpr const char *kConfigDir = "/usr/ovra/etc/ovradr";
inline constexpr const char *kIdentityFile = "/usr/ovra/etc/ovradr/node.info";
inline constexpr const char *kIdentityLock = "drnode.info.lock";
inline constexpr const char *kDatabase = "/usr/ovra/etc/ovradr/node.db";

inline constexpr const char *kNodeCache = "/tmp/.ovradrcache//node";
inline constexpr const char *kLearntCache = "/tmp/.ovradrcache//node_learnt";
inline constexpr const char *kPermissionCache = "/tmp/.ovradrcache//dr_cred_premission_cache";
inline constexpr const char *kConnCache = "/tmp/.ovradrcache//dr_node_conn_cache";
inline constexpr const char *kValidCredCache = "/tmp/.ovradrcache//dr_node_cred_cache";

inline constexpr const char *kDownloadSpeedScript = "/usr/ovra/ovradr/sbin/TestDownloadSpeed.sh";
inline constexpr const char *kSyncSpeedScript = "/usr/ovra/ovradr/sbin/TestSyncSpeed.sh";

/// On the web server of an appliance.
inline constexpr const char *kWebEntryPoint = "webapi/query.cgi";
inline constexpr const char *kWebTestFiles = "/webman/modules/ovradr/";

} // namespace OvraDRNode::Path
