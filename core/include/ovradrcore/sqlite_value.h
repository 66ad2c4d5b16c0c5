// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovradrcore/export.h"

#include <cstddef>
#include <string>
#include <utility>
#include <variant>
#include <vector>

namespace OvraDRCore {

/// One cell: text (any bytes, NUL included), a signed 32-bit integer, or, by default, none.
class OVRADRCORE_EXPORT SqliteValue {
public:
    SqliteValue() = default;
    SqliteValue(const std::string &text)
        : value_(text) {} // NOLINT(google-explicit-constructor)
    SqliteValue(const char *text)
        : value_(std::string(text)) {} // NOLINT(google-explicit-constructor)
    SqliteValue(int number)
        : value_(number) {} // NOLINT(google-explicit-constructor)

    /// True, and sets `text`, if the value holds text.
    [[nodiscard]] bool GetValue(std::string &text) const;
    /// True, and sets `number`, if the value holds an integer.
    [[nodiscard]] bool GetValue(int &number) const;
    /// The value as an SQL literal; text with a NUL in it as the text of its bytes; none as NULL.
    std::string ToLiteral() const;

private:
    std::variant<std::monostate, std::string, int> value_;
};

/// One row: named values in the order in which they were added. Empty means no row.
class OVRADRCORE_EXPORT SqliteValueList {
public:
    using Column = std::pair<std::string, SqliteValue>;

    /// Adds a column, or replaces the value of an existing one.
    void AddValue(const std::string &name, const SqliteValue &value);
    /// The column's value; none for an absent column.
    SqliteValue GetValue(const std::string &name) const;
    /// True, and sets the target, if the column exists and is convertible; an integer reads as its
    /// decimal text, and decimal text that fits reads as an integer.
    [[nodiscard]] bool GetValue(const std::string &name, std::string &text) const;
    [[nodiscard]] bool GetValue(const std::string &name, int &number) const;

    bool empty() const { return columns_.empty(); }
    std::size_t size() const { return columns_.size(); }
    std::vector<Column>::const_iterator begin() const { return columns_.begin(); }
    std::vector<Column>::const_iterator end() const { return columns_.end(); }

private:
    const SqliteValue *find(const std::string &name) const;

    std::vector<Column> columns_;
};

/// A record class that maps to a table row.
class OVRADRCORE_EXPORT SqliteRecord {
public:
    /// The current values of the listed columns that the record has.
    virtual SqliteValueList ToSqliteValues(const std::vector<std::string> &fields) const = 0;
    /// Loads the columns that the record has; false if the row has none of them.
    [[nodiscard]] virtual bool FromSqliteValues(const SqliteValueList &row) = 0;
    /// The record's column names, in its own order.
    virtual std::vector<std::string> ListSqliteField() const = 0;

    /// The whole row.
    SqliteValueList ToSqliteRecord() const { return ToSqliteValues(ListSqliteField()); }

protected:
    SqliteRecord() = default;
    SqliteRecord(const SqliteRecord &) = default;
    SqliteRecord &operator=(const SqliteRecord &) = default;
    ~SqliteRecord() = default;
};

} // namespace OvraDRCore
