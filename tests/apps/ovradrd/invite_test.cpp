// SPDX-License-Identifier: Apache-2.0
#include "appliance.h"
#include "platform/own_files.h"
#include "shared/invites.h"

#include <ovradrnode/dr_node.h>
#include <ovraplatform/account_store.h>
#include <ovraplatform/session_store.h>

#include <algorithm>
#include <functional>
#include <future>
#include <vector>

namespace {

using OvraApps::Invite;
using OvraApps::Invites;
using OvraPlatform::AccountStore;
using OvraPlatform::Role;
using OvraTest::Reply;

class Invitation : public OvraTest::Appliance {
protected:
    void SetUp() override {
        Appliance::SetUp();
        addAccount("pair", false);
        ASSERT_TRUE(AccountStore().setRole("pair", Role::kPairing));
    }

    static Invites::Made made(std::int64_t seconds = 60) {
        auto invite = Invites().make("pair", seconds);
        EXPECT_TRUE(invite);
        return *std::move(invite);
    }
    Reply redeem(const std::string &reference, const std::string &secret,
                 const std::string &node = "n1", bool tls = true) const {
        Json::Value params;
        params["invite"] = reference;
        params["secret"] = secret;
        params["node_id"] = node;
        return call(OvraApps::kInviteApi, 1, OvraApps::kRedeem, params, "", tls);
    }
    Reply redeem(const Invites::Made &invite) const {
        return redeem(invite.invite.reference, invite.secret.get());
    }
    static std::size_t sessions() {
        std::vector<OvraPlatform::SessionRecord> all;
        EXPECT_TRUE(OvraPlatform::SessionStore().list(all));
        return all.size();
    }
};

TEST_F(Invitation, OpensOneShortSessionOfItsAccountAlsoToEightAtOnceAndAcrossARestart) {
    const Invites::Made invite = made();
    std::vector<std::future<Reply>> tries;
    for (int i = 0; i < 8; ++i) {
        tries.push_back(std::async(std::launch::async, [&] { return redeem(invite); }));
    }
    std::string sid;
    for (auto &each : tries) {
        const Reply reply = each.get();
        EXPECT_TRUE(reply.code() == 411 || (reply.code() == 0 && sid.empty())) << reply.text;
        sid = reply.code() == 0 ? reply.data()["sid"].asString() : sid;
    }
    EXPECT_EQ(call("OVRA.DR.Node", 1, "test_privilege", {}, sid).code(), 0);
    const auto record = OvraPlatform::SessionStore().find(sid);
    ASSERT_TRUE(record);
    EXPECT_EQ(record->user, "pair");
    EXPECT_EQ(record->expires.value_or(0) - record->created, 300);
    const Invites::Made other = made();
    restart({});
    EXPECT_EQ(redeem(invite).code(), 411);
    EXPECT_EQ(redeem(other).code(), 0);
    EXPECT_EQ(sessions(), 2U);
    std::vector<Invite> all;
    ASSERT_TRUE(Invites().list(all));
    EXPECT_TRUE(std::all_of(all.begin(), all.end(), [](const Invite &each) {
        return each.state == Invite::State::kUsed && each.node == "n1" &&
               each.address == "127.0.0.1";
    }));
    EXPECT_EQ(OvraTest::readFile(OvraApps::kInvitesFile).find(other.secret.get()),
              std::string::npos);
}

TEST_F(Invitation, IsRefusedWithTheReasonToWhoKnowsItsSecretAndNothingIsLeftBehind) {
    AccountStore accounts;
    using Arrange = std::function<bool(const Invite &)>;
    const std::tuple<Arrange, Arrange, int> cases[] = {
        // what happens before, and to have it open again
        {[](const Invite &each) { return Invites().revoke(each.reference); }, {}, 413},
        {[&](const Invite &) { return accounts.setDisabled("pair", true); },
         [&](const Invite &) { return accounts.setDisabled("pair", false); }, 414},
        {[&](const Invite &) { return accounts.setRole("pair", Role::kUser); },
         [&](const Invite &) { return accounts.setRole("pair", Role::kPairing); }, 414},
    };
    for (const auto &[before, after, code] : cases) {
        const Invites::Made invite = made();
        ASSERT_TRUE(before(invite.invite));
        EXPECT_EQ(redeem(invite).code(), code);
        EXPECT_EQ(redeem(invite.invite.reference, std::string(16, 'x')).code(), 410);
        EXPECT_EQ(sessions(), 0U);
        if (after) {
            ASSERT_TRUE(after(invite.invite));
            Invite taken;
            EXPECT_EQ(Invites().take(invite.invite.reference, invite.secret.get(), "n", "", taken),
                      OvraApps::InviteRefusal::kNone);
        }
    }
    const Invites::Made invite = made();
    const std::string &reference = invite.invite.reference;
    EXPECT_EQ(redeem(made(0)).code(), 412);
    EXPECT_EQ(redeem("00000000", invite.secret.get()).code(), 410);
    EXPECT_EQ(redeem("0000000G", invite.secret.get()).code(), 106);
    EXPECT_EQ(redeem(reference, invite.secret.get(), OvraDRNode::DRNode::getLocalNodeId()).code(),
              106);
    EXPECT_EQ(redeem(reference, invite.secret.get(), "n1", false).code(), 109) << "not sealed";
    EXPECT_EQ(sessions(), 0U);
    EXPECT_EQ(redeem(invite).code(), 0);
}

TEST_F(Invitation, IsNotGuessedAndGuessesAtOneKeepNobodyFromAnother) {
    const Invites::Made invite = made();
    for (int i = 0; i < 10; ++i) {
        EXPECT_EQ(redeem(invite.invite.reference, std::string(16, 'x')).code(), 410);
    }
    EXPECT_EQ(redeem(invite).code(), 107);
    restart({});
    EXPECT_EQ(redeem(invite).code(), 107);
    EXPECT_EQ(redeem(made()).code(), 0);
}

} // namespace
