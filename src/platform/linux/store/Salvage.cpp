// SPDX-License-Identifier: Apache-2.0
// Each batch prepares its statements again: it costs little, and none is left when the database is closed.
#include "platform/linux/store/Salvage.h"

#include "platform/linux/store/tables/SalvagedTables.h"

#include <algorithm>
#include <fmt/format.h>
#include <limits>
#include <utility>

namespace platform {
namespace {

// More rows than a page can hold: the shortest has a dozen bytes.
constexpr std::int64_t mostRowsOnPage = 512;
// Far above any number that was given out, and far below those at which SQLite has no more.
constexpr std::int64_t highestNumber = std::int64_t{1} << 56;

std::string inQuotes(std::string_view name)
{
    std::string text = "\"";
    for (const char each : name)
        text.append(each == '"' ? 2 : 1, each);
    return text += '"';
}

bool hasType(const StoredValue& value, std::string_view type)
{
    const bool isInteger = std::holds_alternative<std::int64_t>(value);
    if (type == "INTEGER" || type == "INT")
        return isInteger;
    if (type == "REAL") // a number without a fraction is stored as an integer
        return isInteger || std::holds_alternative<double>(value);
    if (type == "TEXT")
        return std::holds_alternative<std::string_view>(value);
    if (type == "BLOB")
        return std::holds_alternative<StoredBytes>(value);
    return true;
}

// The database's own count of the numbers it gave out, which SQLite keeps for each table.
std::int64_t sequenceIn(const StoredRow& row)
{
    if (row.values.size() != 2)
        return 0;
    const auto* name = std::get_if<std::string_view>(&row.values.front());
    const auto* number = std::get_if<std::int64_t>(&row.values.back());
    return name != nullptr && SalvagedTables::holdsEvents(*name) && number != nullptr && *number <= highestNumber
        ? *number
        : 0;
}

} // namespace

// Puts rows into one table, as long as it exists.
class Salvage::Inserter {
public:
    [[nodiscard]] static StoreExpected<Inserter> into(SqliteConnection& connection, const Table& table)
    {
        auto statement = connection.prepare(insertionInto(table));
        if (!statement)
            return std::unexpected(statement.error());
        return Inserter(*std::move(statement), table);
    }

    // Copies the whole rows of that page. Returns how many bytes they have.
    [[nodiscard]] StoreExpected<std::uint64_t> copy(DatabaseRows& rows, std::size_t page)
    {
        std::uint64_t bytes = 0;
        if (!rows.goTo(static_cast<std::uint32_t>(page)))
            return bytes;
        while (const StoredRow* row = rows.next()) {
            if (!fits(*row, *table_))
                continue;
            if (const auto done = insert(*row); !done)
                return std::unexpected(done.error());
            bytes += row->size;
            ++copiedRows_;
        }
        return bytes;
    }
    [[nodiscard]] std::uint64_t rows() const noexcept { return copiedRows_; }

private:
    Inserter(SqliteStatement statement, const Table& table) : statement_(std::move(statement)), table_(&table) { }

    // A row that is there already, or that the table does not take, is left out.
    [[nodiscard]] StoreExpected<> insert(const StoredRow& row) const
    {
        int parameter = 1;
        statement_.bind(parameter, row.number);
        for (std::size_t place = 0; place < table_->columns.size(); ++place)
            if (!table_->columns[place].isRowid)
                bind(++parameter, row.values[place]);
        return statement_.run();
    }

    void bind(int parameter, const StoredValue& value) const
    {
        if (const auto* integer = std::get_if<std::int64_t>(&value))
            statement_.bind(parameter, *integer);
        else if (const auto* real = std::get_if<double>(&value))
            statement_.bind(parameter, *real);
        else if (const auto* text = std::get_if<std::string_view>(&value))
            statement_.bind(parameter, *text);
        else
            statement_.bindNull(parameter);
    }

    SqliteStatement statement_;
    const Table* table_;
    std::uint64_t copiedRows_ = 0;
};

StoreExpected<std::unique_ptr<Salvage>> Salvage::begin(std::filesystem::path damaged, SqliteConnection& into)
{
    std::unique_ptr<Salvage> salvage(new Salvage(std::move(damaged)));
    if (const auto done = SalvagedTables::prepare(into); !done)
        return std::unexpected(done.error());
    if (const auto done = salvage->readTables(into); !done)
        return std::unexpected(done.error());
    salvage->lookAtPages();
    auto done = into.execute("BEGIN IMMEDIATE");
    if (done)
        done = salvage->copySmallTables(into);
    if (done)
        done = into.execute("COMMIT");
    if (done)
        done = SalvagedTables::begin(into, salvage->lastNumber_, salvage->mayHaveMore_);
    if (!done) {
        into.rollBack();
        return std::unexpected(done.error());
    }
    return salvage;
}

Salvage::Salvage(std::filesystem::path damaged) : damaged_(std::move(damaged)), rows_(DatabasePages(damaged_)) { }

// --- The tables

StoreExpected<> Salvage::readTables(SqliteConnection& from)
{
    const auto names = from.prepare("SELECT name FROM pragma_table_list WHERE schema = 'main' AND type = 'table'"
                                    " AND wr = 0 AND name NOT LIKE 'sqlite_%' ORDER BY name");
    if (!names)
        return std::unexpected(names.error());
    auto row = names->step();
    for (; row && *row && tables_.size() < noTable; row = names->step())
        if (const std::string_view name = names->text(0); !SalvagedTables::isTarget(name))
            tables_.push_back({.name = std::string(name), .columns = {}});
    if (!row)
        return std::unexpected(row.error());
    names->reset();
    for (Table& table : tables_)
        if (const auto done = readColumns(from, table); !done)
            return done;
    return {};
}

StoreExpected<> Salvage::readColumns(SqliteConnection& from, Table& table)
{
    const auto columns = from.prepare(fmt::format("PRAGMA table_info({})", inQuotes(table.name)));
    if (!columns)
        return std::unexpected(columns.error());
    auto row = columns->step();
    for (; row && *row; row = columns->step()) {
        const bool isKey = columns->integer(5) != 0;
        const std::string type(columns->text(2));
        table.columns.push_back({.name = std::string(columns->text(1)),
                                 .type = type,
                                 .mayBeNull = columns->integer(3) == 0,
                                 .isRowid = isKey && type == "INTEGER"});
    }
    return row ? StoreExpected<>() : std::unexpected(row.error());
}

bool Salvage::fits(const StoredRow& row, const Table& table)
{
    if (row.values.size() != table.columns.size() || row.number > highestNumber)
        return false;
    for (std::size_t place = 0; place < table.columns.size(); ++place) {
        const Column& column = table.columns[place];
        const bool isNull = std::holds_alternative<std::monostate>(row.values[place]);
        if (isNull ? !column.isRowid && !column.mayBeNull : column.isRowid || !hasType(row.values[place], column.type))
            return false;
    }
    return true;
}

Salvage::Table* Salvage::tableOf(const StoredRow& row)
{
    const auto found = std::ranges::find_if(tables_, [&](const Table& table) { return fits(row, table); });
    return found == tables_.end() ? nullptr : &*found;
}

std::string Salvage::insertionInto(const Table& table)
{
    std::string columns = "rowid";
    std::string values = "?";
    for (const Column& column : table.columns)
        if (!column.isRowid) {
            columns += ", " + inQuotes(column.name);
            values += ", ?";
        }
    return fmt::format("INSERT OR IGNORE INTO {} ({}) VALUES ({})", inQuotes(SalvagedTables::targetOf(table.name)),
                       columns, values);
}

// --- The pages

void Salvage::lookAtPages()
{
    tableOfPage_.assign(rows_.pageCount() + 1, noTable);
    for (std::uint32_t page = 1; page <= rows_.pageCount(); ++page)
        lookAtPage(page);
    lastNumber_ = sequence_;
    std::uint32_t most = pagesAtOnce;
    for (std::size_t table = 0; table < tables_.size(); ++table) {
        if (SalvagedTables::isNumberedAsEvents(tables_[table].name))
            lastNumber_ = std::max(lastNumber_, tables_[table].lastNumber);
        if (SalvagedTables::holdsEvents(tables_[table].name) && tables_[table].pages > most) {
            most = tables_[table].pages;
            large_ = static_cast<std::uint8_t>(table);
        }
    }
    // Without that count, any page that could not be read may have held the last rows.
    mayHaveMore_ = sequence_ != 0 ? 0 : std::ranges::count(tableOfPage_, noTable) * mostRowsOnPage;
    goToNext(0);
}

void Salvage::lookAtPage(std::uint32_t page)
{
    if (!rows_.goTo(page))
        return;
    Table* table = nullptr;
    while (const StoredRow* row = rows_.next()) {
        sequence_ = std::max(sequence_, sequenceIn(*row));
        if (table == nullptr)
            table = tableOf(*row);
        if (table != nullptr && fits(*row, *table))
            table->lastNumber = std::max(table->lastNumber, row->number);
    }
    if (table == nullptr)
        return;
    ++table->pages;
    tableOfPage_[page] = static_cast<std::uint8_t>(table - tables_.data());
}

// --- Copying

StoreExpected<> Salvage::copySmallTables(SqliteConnection& into)
{
    for (std::size_t table = 0; table < tables_.size(); ++table) {
        if (table == large_)
            continue;
        auto inserter = Inserter::into(into, tables_[table]);
        if (!inserter)
            return std::unexpected(inserter.error());
        for (std::size_t page = 1; page < tableOfPage_.size(); ++page)
            if (tableOfPage_[page] == table)
                if (const auto copied = inserter->copy(rows_, page); !copied)
                    return std::unexpected(copied.error());
        if (SalvagedTables::holdsEvents(tables_[table].name))
            copiedMessages_ += inserter->rows();
    }
    return {};
}

StoreExpected<> Salvage::copySome(SqliteEventFile& into)
{
    const std::size_t first = next_;
    const auto done = copyBatch(into);
    if (!done)
        next_ = first;
    return done;
}

StoreExpected<> Salvage::copyBatch(SqliteEventFile& into)
{
    if (const auto done = into.begin(); !done)
        return done;
    auto inserter = Inserter::into(into.connection(), tables_[large_]);
    if (!inserter)
        return std::unexpected(inserter.error());
    for (std::uint64_t bytes = 0; hasMore() && bytes < bytesAtOnce; goToNext(next_ + 1)) {
        const auto copied = inserter->copy(rows_, next_);
        if (!copied)
            return std::unexpected(copied.error());
        bytes += *copied;
    }
    if (const auto done = into.commit(); !done)
        return done;
    copiedMessages_ += inserter->rows();
    return {};
}

void Salvage::goToNext(std::size_t page)
{
    next_ = tableOfPage_.size();
    if (large_ == noTable)
        return;
    const auto next = std::find(tableOfPage_.begin() + static_cast<std::ptrdiff_t>(page), tableOfPage_.end(), large_);
    next_ = static_cast<std::size_t>(next - tableOfPage_.begin());
}

} // namespace platform
