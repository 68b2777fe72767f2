// tests/unit/usermgmt/account_model_changes.cpp: what each change does to users and groups, worked
// out by rules of its own.
#include <algorithm>

#include "tests/unit/usermgmt/account_model.h"

static bool contains(const std::string &text, const char *part) {
    return text.find(part) != std::string::npos;
}

// Refused where the groups are changed already.
static bool is_password_refused(const std::string &error) {
    return contains(error, "crypt() failed") || contains(error, "invalid password of size 0") ||
           contains(error, "could not create password salt");
}

account_model::write_request account_model::change(const operation &what,
                                                   const operation_result &result) {
    switch (what.kind) {
        case operation_kind::add_user:
            return add_user(what, result);
        case operation_kind::modify_user:
            return modify_user(what, result);
        case operation_kind::delete_user:
            return delete_user(what);
        case operation_kind::disable_password:
            return disable_password(what);
        case operation_kind::add_group:
            return add_group(what);
        case operation_kind::delete_group:
            return delete_group(what);
        case operation_kind::reopen:
            break;
    }
    return {};
}

// A refusal changes nothing, but some load files again.
void account_model::refused(const operation &what, const operation_result &result) {
    if (!what.account)
        return;
    if (what.kind == operation_kind::delete_group && contains(result.error, "out of sync")) {
        reload(LOAD_EVERYTHING, result);
    } else if (what.kind == operation_kind::modify_user) {
        guint32 pending =
            contains(result.error, ", primary group (") ? guint32{LOAD_EVERYTHING} : 0;
        if (is_password_refused(result.error))
            pending = modify_user(what, result).mask;
        reload(pending | (users_dirty_ ? 1U : 0U) | (groups_dirty_ ? 2U : 0U), result);
    }
}

void account_model::set_password(model_user *user, const std::string &clear_text,
                                 const operation_result &result) {
    const std::string old = user->password.value_or("");
    if (old.starts_with("$") && cheap_hash(clear_text.c_str(), old.c_str()) == old)
        return;
    user->password = result.new_hash;
    user->last_change = result.now;
    users_dirty_ = true;
    require(result.new_hash.starts_with("$5$") && result.new_hash.find('$', 3) == 15 &&
                cheap_hash(clear_text.c_str(), result.new_hash.c_str()) == result.new_hash,
            "the hash is none of this password");
}

account_model::write_request account_model::add_user(const operation &what,
                                                     const operation_result &result) {
    model_user added = {};
    model_group *primary = what.group ? group(*what.group) : nullptr;
    require(primary != nullptr && what.account == what.name && user(*what.name) == nullptr &&
                (what.type == 2 || what.type == 3 || what.type == 4),
            "added what should have been refused");
    if (!objection_.empty())
        return {};
    added.type = what.type;
    added.name = *what.name;
    added.shadowed = has_shadow_;
    added.gecos = what.gecos;
    added.shell = what.shell.value_or("/bin/false");
    added.gid = primary->gid;
    if (what.password)
        set_password(&added, *what.password, result);

    static constexpr guint32 first[] = {0, 0, 1, 999, 1000};
    added.uid = first[what.type];
    for (const model_user &other : users_)
        if (other.type == what.type)
            added.uid = what.type == 3 ? std::min(added.uid, other.uid - 1)
                                       : std::max(added.uid, other.uid + 1);
    if (what.uid != -1)
        added.uid = static_cast<guint32>(what.uid);
    for (const model_user &other : users_)
        require(other.uid != added.uid, "gave a UID twice");

    for (model_group &group : groups_) {
        const bool wanted =
            &group == primary || (what.names && std::find(what.names->begin(), what.names->end(),
                                                          group.name) != what.names->end());
        if (wanted && group.members.insert(added.name).second)
            groups_dirty_ = true;
    }
    users_.push_back(added);
    users_dirty_ = true;
    return {true, LOAD_PASSWD};
}

void account_model::set_groups(const std::string &user, const std::string &primary,
                               const std::vector<std::string> &wanted) {
    for (model_group &group : groups_) {
        if (group.name == primary)
            continue;
        const bool joins = std::find(wanted.begin(), wanted.end(), group.name) != wanted.end();
        if (joins ? group.members.insert(user).second : group.members.erase(user) > 0)
            groups_dirty_ = true;
    }
}

account_model::write_request account_model::modify_user(const operation &what,
                                                        const operation_result &result) {
    model_user *changed = user(*what.account);
    const bool nothing = !what.password && !what.group && !what.names && !what.gecos && !what.shell;
    require(changed != nullptr && (!what.name || what.name == what.account) &&
                (what.type == 0 || what.type == changed->type) &&
                (nothing || changed->type == 1 || changed->type == 3 || changed->type == 4 ||
                 *what.account == "anonymous"),
            "modified what should have been refused");
    if (nothing || !objection_.empty())
        return {};
    require(changed->type != 1 ||
                (what.password && !what.group && !what.names && !what.gecos && !what.shell),
            "modified more of root than the password");

    guint32 mask = 0;
    model_group *primary = group_of(changed->gid);
    model_group *next = what.group ? group(*what.group) : primary;
    if (next != primary && primary != nullptr && next != nullptr) {
        const bool left = primary->members.erase(changed->name) > 0;
        const bool joined = next->members.insert(changed->name).second;
        changed->gid = next->gid;
        users_dirty_ = users_dirty_ || left || joined;
        groups_dirty_ = groups_dirty_ || left || joined;
        mask = LOAD_PASSWD | LOAD_GROUP;
    }
    if (what.names && next != nullptr)
        set_groups(changed->name, next->name, *what.names);
    if (is_password_refused(result.error))
        return {false, mask};
    if (what.password)
        set_password(changed, *what.password, result);
    for (const auto &[wanted, field] :
         {std::pair(&what.gecos, &changed->gecos), std::pair(&what.shell, &changed->shell)}) {
        if (!*wanted || *wanted == *field)
            continue;
        *field = *wanted;
        users_dirty_ = true;
    }
    return {true, mask | (users_dirty_ ? 1U : 0U) | (groups_dirty_ ? 2U : 0U)};
}

account_model::write_request account_model::delete_user(const operation &what) {
    const model_user *gone = user(*what.account);
    require(gone != nullptr && (gone->type == 3 || gone->type == 4),
            "deleted what should have been refused");
    if (!objection_.empty())
        return {};
    for (model_group &group : groups_)
        if (group.members.erase(*what.account) > 0)
            groups_dirty_ = true;
    users_.erase(users_.begin() + (gone - users_.data()));
    users_dirty_ = true;
    return {true, LOAD_PASSWD | LOAD_GROUP};
}

account_model::write_request account_model::disable_password(const operation &what) {
    model_user *changed = user(*what.account);
    require(changed != nullptr && (changed->type == 2 || changed->type == 3),
            "disabled what should have been refused");
    if (!objection_.empty() || (!changed->password && changed->shadowed == has_shadow_))
        return {};
    changed->password.reset();
    changed->shadowed = has_shadow_;
    users_dirty_ = true;
    return {true, LOAD_PASSWD | LOAD_SHADOW};
}

account_model::write_request account_model::add_group(const operation &what) {
    require(group(*what.account) == nullptr, "added a group twice");
    model_group added = {3, *what.account, std::nullopt, 999, {}};
    for (const model_group &other : groups_)
        if (other.type == 3)
            added.gid = std::min(added.gid, other.gid - 1);
    require(added.gid >= 500, "gave a GID out of its range");
    for (const std::string &member : what.names.value_or(std::vector<std::string>())) {
        require(user(member) != nullptr, "added a member that is no user");
        added.members.insert(member);
    }
    groups_.push_back(added);
    groups_dirty_ = true;
    return {true, LOAD_GROUP};
}

account_model::write_request account_model::delete_group(const operation &what) {
    const model_group *gone = group(*what.account);
    require(gone != nullptr && (gone->type == 3 || gone->type == 5),
            "deleted what should have been refused");
    if (!objection_.empty())
        return {};
    for (const std::string &member : gone->members)
        require(user(member) != nullptr && user(member)->gid != gone->gid,
                "deleted a group that a member needs");
    groups_.erase(groups_.begin() + (gone - groups_.data()));
    groups_dirty_ = true;
    return {true, LOAD_GROUP};
}
