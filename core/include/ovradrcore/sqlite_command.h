// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovradrcore/export.h"
#include "ovradrcore/sqlite_value.h"

#include <string>
#include <vector>

namespace OvraDRCore {

/// Names one table, created by provisioning.
class OVRADRCORE_EXPORT SqliteTableHandler {
public:
    /// \param schema  kept for the layer's interface; a handler never creates its table
    SqliteTableHandler(const std::string &name, const std::string &schema);
    SqliteTableHandler(const SqliteTableHandler &) = default;
    SqliteTableHandler &operator=(const SqliteTableHandler &) = default;
    virtual ~SqliteTableHandler();

    const std::string &GetName() const { return name_; }

private:
    std::string name_;
    std::string schema_;
};

/// A row filter. `text` is its SQL; empty text is an invalid filter, which every statement rejects.
class OVRADRCORE_EXPORT SqliteCondition {
public:
    virtual bool IsValid() const;

    SqliteCondition() = default;
    explicit SqliteCondition(const std::string &sql)
        : text(sql) {}

    std::string text;
};

/// The column equals the value. An empty column name gives an invalid filter.
class OVRADRCORE_EXPORT SqliteEqual : public SqliteCondition {
public:
    SqliteEqual(const std::string &field, const SqliteValue &value);
};

/// Both filters hold. If either is invalid, so is the whole.
class OVRADRCORE_EXPORT SqliteAnd : public SqliteCondition {
public:
    SqliteAnd(const SqliteCondition &left, const SqliteCondition &right);
};

/// A statement on one table.
class OVRADRCORE_EXPORT SqliteCommand {
public:
    SqliteCommand() = default;
    SqliteCommand(const SqliteCommand &) = default;
    SqliteCommand &operator=(const SqliteCommand &) = default;
    virtual ~SqliteCommand();

    void SetTable(const SqliteTableHandler &table) { table_ = table.GetName(); }
    /// The full statement, exact; "" if it is incomplete (no table, no column, or a condition that
    /// was set but is empty or invalid).
    std::string ToStr() const { return render(false); }
    /// As ToStr(), for log lines: values of a "session" column show as '***'.
    std::string ToLogStr() const { return render(true); }

protected:
    virtual std::string render(bool masked) const = 0;
    const std::string &table() const { return table_; }

private:
    std::string table_;
};

class OVRADRCORE_EXPORT SelectCommand : public SqliteCommand {
public:
    void AddField(const std::string &name) { fields_.push_back(name); }
    void SelectAll() { all_ = true; }
    /// Without a condition every row is selected; one that is set never widens to that.
    void SetCondition(const SqliteCondition &condition);
    void SetCondition(const std::string &text);

protected:
    std::string render(bool masked) const override;

private:
    bool all_ = false;
    std::vector<std::string> fields_;
    bool filtered_ = false;
    std::string condition_;
};

class OVRADRCORE_EXPORT InsertCommand : public SqliteCommand {
public:
    void AddFieldValue(const std::string &field, const std::string &value);
    void AddFieldValue(const std::string &field, int value);
    /// Replaces all columns.
    void SetFieldValues(const SqliteValueList &values) { values_ = values; }

protected:
    std::string render(bool masked) const override;

private:
    SqliteValueList values_;
};

class OVRADRCORE_EXPORT UpdateCommand : public SqliteCommand {
public:
    void AddFieldValue(const std::string &field, const std::string &value);
    void AddFieldValue(const std::string &field, int value);
    /// Replaces all assignments.
    void SetFieldValues(const SqliteValueList &values) { values_ = values; }
    /// Without a condition every row is changed; one that is set never widens to that.
    void SetCondition(const SqliteCondition &condition);
    void SetCondition(const std::string &text);

protected:
    std::string render(bool masked) const override;

private:
    SqliteValueList values_;
    bool filtered_ = false;
    std::string condition_;
};

/// Deletes the rows that match a condition; incomplete without one.
class OVRADRCORE_EXPORT DeleteCommand : public SqliteCommand {
public:
    void SetCondition(const std::string &text) { condition_ = text; }

protected:
    std::string render(bool masked) const override;

private:
    std::string condition_;
};

} // namespace OvraDRCore
