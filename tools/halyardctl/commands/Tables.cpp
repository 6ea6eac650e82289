// The tables that need no adding up: events, energy, incidents and metrics.
#include <fmt/format.h>
#include <limits>
#include <protozero/pbf_reader.hpp>

#include "commands/Commands.h"
#include "commands/Listing.h"
#include "commands/TableRows.h"
#include "output/Words.h"

namespace halyard::ctl {
namespace {

using Align = Table::Column::Align;
using linux_::StoreTable;
using reading::Row;

// What the daemon posts when a program reports an issue.
constexpr std::int64_t kAudioIssueDetected = 0x5B0003;

struct AudioIssue {
    std::optional<std::uint64_t> timestamp;
    std::int32_t duration = 0;
    std::string issueType;
    std::string node;
    std::string client;
};

// None for bytes that are no such message.
std::optional<AudioIssue> audioIssueIn(std::string_view bytes) try {
    AudioIssue issue;
    protozero::pbf_reader message(bytes.data(), bytes.size());
    while (message.next()) {
        switch (message.tag_and_type()) {
        case protozero::tag_and_type(1, protozero::pbf_wire_type::varint):
            issue.timestamp = message.get_uint64();
            break;
        case protozero::tag_and_type(2, protozero::pbf_wire_type::varint):
            issue.duration = message.get_int32();
            break;
        case protozero::tag_and_type(3, protozero::pbf_wire_type::length_delimited):
            issue.issueType = message.get_string();
            break;
        case protozero::tag_and_type(4, protozero::pbf_wire_type::length_delimited):
            issue.node = message.get_string();
            break;
        case protozero::tag_and_type(5, protozero::pbf_wire_type::length_delimited):
            issue.client = message.get_string();
            break;
        default:
            message.skip();
            break;
        }
    }
    return issue;
} catch (const protozero::exception&) {
    return std::nullopt;
}

void writeMessage(JsonStream& json, const Row& row) {
    json.key("message");
    const auto issue =
        row.integer(1) == kAudioIssueDetected ? audioIssueIn(row.text(2)) : std::nullopt;
    if (!issue) {
        return json.null();
    }
    json.beginObject();
    json.field("duration", std::optional(std::int64_t{issue->duration}));
    json.field("issuetype", std::string_view(issue->issueType));
    json.field("node", std::string_view(issue->node));
    json.field("rtaidclient", std::string_view(issue->client));
    if (issue->timestamp) {
        json.countField("timestamp", *issue->timestamp);
    }
    json.endObject();
}

// Columns by the kind that their table says they have.
void writeColumns(JsonStream& json, const linux_::StoreTableSchema& table, const Row& row) {
    json.field("id", row.maybeInteger(0));
    int index = 1;
    for (const linux_::StoreColumn& column : table.columns) {
        if (column.holds == linux_::StoreColumn::Holds::Json) {
            json.jsonField(column.name, row.text(index));
        } else if (column.type == "REAL") {
            json.field(column.name, row.maybeReal(index));
        } else if (column.type == "INTEGER") {
            json.field(column.name, row.maybeInteger(index));
        } else if (row.isNull(index)) {
            json.field(column.name, nullptr);
        } else {
            json.field(column.name, row.text(index));
        }
        ++index;
    }
}

std::string cellOf(const linux_::StoreColumn& column, const Row& row, int index) {
    if (column.name == "time") {
        return dayAndTime(row.maybeReal(index));
    }
    if (column.type == "INTEGER") {
        const auto number = row.maybeInteger(index);
        return number ? std::to_string(*number) : "";
    }
    return std::string(row.text(index));
}

std::vector<Cell> cellsOf(const linux_::StoreTableSchema& table, const Row& row) {
    std::vector<Cell> cells = {std::to_string(row.integer(0))};
    int index = 1;
    for (const linux_::StoreColumn& column : table.columns) {
        cells.emplace_back(cellOf(column, row, index++));
    }
    return cells;
}

std::vector<Cell> metricCells(const Row& row) {
    const auto issue = audioIssueIn(row.text(2));
    std::vector<Cell> cells = {std::to_string(row.integer(0)), std::to_string(row.integer(1)),
                               dayAndTime(row.maybeReal(3))};
    if (row.integer(1) == kAudioIssueDetected && issue) {
        cells.insert(cells.end(), {std::to_string(issue->duration), issue->issueType, issue->node,
                                   issue->client});
    } else {
        cells.insert(cells.end(), 4, Cell(""));
    }
    return cells;
}

std::vector<Table::Column> columnsOf(const linux_::StoreTableSchema& table) {
    std::vector<Table::Column> columns = {{"ID", Align::Right, false, 1}};
    for (const linux_::StoreColumn& column : table.columns) {
        std::string title(column.name);
        for (char& letter : title) {
            letter =
                letter >= 'a' && letter <= 'z' ? static_cast<char>(letter - 'a' + 'A') : letter;
        }
        columns.push_back({title, Align::Left, column.type == "TEXT"});
    }
    return columns;
}

} // namespace

void writeRow(JsonStream& json, StoreTable table, const Row& row) {
    json.beginObject();
    if (table == StoreTable::Metric) {
        json.field("id", row.maybeInteger(0));
        json.field("metric_id", row.maybeInteger(1));
        json.field("time", row.maybeReal(3));
        writeMessage(json, row);
    } else {
        writeColumns(json, storeSchema(table), row);
    }
    json.endObject();
}

Exit runTable(Context& context, StoreTable table) {
    const linux_::StoreTableSchema& schema = storeSchema(table);
    const auto forEach = [&schema](Context& of,
                                   const std::function<bool(const Row&)>& take) -> Outcome<void> {
        auto reader = of.openStore();
        if (!reader.ok()) {
            return reader.failure();
        }
        const auto ids = reader.value().idsIn(of.range, schema.name, "time");
        if (!ids.ok()) {
            return ids.failure();
        }
        return reader.value().forEach({std::string(schema.name), columnNames(schema),
                                       of.range.condition("time"), ids.value().after,
                                       ids.value().upTo},
                                      take);
    };
    if (context.json) {
        return listAsJson<Row>(context, forEach, [table](JsonStream& json, const Row& row) {
            json.beginElement();
            writeRow(json, table, row);
        });
    }
    if (table == StoreTable::Metric) {
        const std::vector<Table::Column> columns = {{"ID", Align::Right, false, 2},
                                                    {"METRIC", Align::Right, false, 1},
                                                    {"TIME"},
                                                    {"DURATION", Align::Right},
                                                    {"ISSUE", Align::Left, true},
                                                    {"NODE", Align::Left, true},
                                                    {"CLIENT", Align::Left, true}};
        return listAsTable<Row>(context, forEach, columns, metricCells, "Nothing.");
    }
    return listAsTable<Row>(
        context, forEach, columnsOf(schema),
        [&schema](const Row& row) { return cellsOf(schema, row); }, "Nothing.");
}

std::string columnNames(const linux_::StoreTableSchema& table) {
    // Without the id, which every scan has.
    return linux_::storeColumnNames(table).substr(std::string_view("id, ").size());
}

} // namespace halyard::ctl
