// SPDX-License-Identifier: Apache-2.0
#include "ovradrcore/sqlite_command.h"

namespace OvraDRCore {

namespace {

/// The one column whose content is login material.
constexpr const char *kSecretColumn = "session";

std::string identifier(const std::string &name) {
    std::string quoted = "\"";
    for (const char c : name) {
        quoted += c;
        if (c == '"') {
            quoted += '"';
        }
    }
    return quoted + "\"";
}

bool isIdentifier(const std::string &name) {
    return !name.empty() && name.find('\0') == std::string::npos;
}

std::string literalOf(const SqliteValueList::Column &column, bool masked) {
    return masked && column.first == kSecretColumn ? "'***'" : column.second.ToLiteral();
}

bool areIdentifiers(const SqliteValueList &values) {
    for (const SqliteValueList::Column &column : values) {
        if (!isIdentifier(column.first)) {
            return false;
        }
    }
    return !values.empty();
}

/// Empty, which every statement rejects, if the condition says that it is invalid.
std::string textOf(const SqliteCondition &condition) {
    return condition.IsValid() ? condition.text : "";
}

std::string whereClause(bool filtered, const std::string &condition) {
    return filtered ? " WHERE " + condition : "";
}

} // namespace

bool SqliteCondition::IsValid() const {
    return !text.empty();
}

SqliteEqual::SqliteEqual(const std::string &field, const SqliteValue &value) {
    if (isIdentifier(field)) {
        text = identifier(field) + " = " + value.ToLiteral();
    }
}

SqliteAnd::SqliteAnd(const SqliteCondition &left, const SqliteCondition &right) {
    if (left.IsValid() && right.IsValid()) {
        text = "(" + left.text + ") AND (" + right.text + ")";
    }
}

SqliteTableHandler::SqliteTableHandler(const std::string &name, const std::string &schema)
    : name_(name)
    , schema_(schema) {}

SqliteTableHandler::~SqliteTableHandler() = default;

SqliteCommand::~SqliteCommand() = default;

void SelectCommand::SetCondition(const SqliteCondition &condition) {
    SetCondition(textOf(condition));
}

void SelectCommand::SetCondition(const std::string &text) {
    filtered_ = true;
    condition_ = text;
}

std::string SelectCommand::render(bool /*masked*/) const {
    std::string fields = all_ ? "*" : "";
    for (const std::string &name : fields_) {
        if (!isIdentifier(name)) {
            return {};
        }
        fields += (fields.empty() ? "" : ", ") + identifier(name);
    }
    if (!isIdentifier(table()) || fields.empty() || (filtered_ && condition_.empty())) {
        return {};
    }
    return "SELECT " + fields + " FROM " + identifier(table()) + whereClause(filtered_, condition_);
}

void InsertCommand::AddFieldValue(const std::string &field, const std::string &value) {
    values_.AddValue(field, value);
}

void InsertCommand::AddFieldValue(const std::string &field, int value) {
    values_.AddValue(field, value);
}

std::string InsertCommand::render(bool masked) const {
    if (!isIdentifier(table()) || !areIdentifiers(values_)) {
        return {};
    }
    // Appended, not added: g++ 12 at -O3 warns falsely (-Wrestrict) of a literal + a string.
    std::string names;
    std::string literals;
    for (const SqliteValueList::Column &column : values_) {
        const char *separator = names.empty() ? "" : ", ";
        names.append(separator).append(identifier(column.first));
        literals.append(separator).append(literalOf(column, masked));
    }
    std::string statement = "INSERT INTO ";
    statement.append(identifier(table())).append(" (").append(names);
    return statement.append(") VALUES (").append(literals).append(")");
}

void UpdateCommand::AddFieldValue(const std::string &field, const std::string &value) {
    values_.AddValue(field, value);
}

void UpdateCommand::AddFieldValue(const std::string &field, int value) {
    values_.AddValue(field, value);
}

void UpdateCommand::SetCondition(const SqliteCondition &condition) {
    SetCondition(textOf(condition));
}

void UpdateCommand::SetCondition(const std::string &text) {
    filtered_ = true;
    condition_ = text;
}

std::string UpdateCommand::render(bool masked) const {
    if (!isIdentifier(table()) || !areIdentifiers(values_) || (filtered_ && condition_.empty())) {
        return {};
    }
    std::string assignments;
    for (const SqliteValueList::Column &column : values_) {
        assignments += (assignments.empty() ? "" : ", ") + identifier(column.first) + " = " +
                       literalOf(column, masked);
    }
    return "UPDATE " + identifier(table()) + " SET " + assignments +
           whereClause(filtered_, condition_);
}

std::string DeleteCommand::render(bool /*masked*/) const {
    if (!isIdentifier(table()) || condition_.empty()) {
        return {};
    }
    return "DELETE FROM " + identifier(table()) + whereClause(true, condition_);
}

} // namespace OvraDRCore
