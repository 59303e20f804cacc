#ifndef TAV_IPMI_TOOLS_OUTPUT_H
#define TAV_IPMI_TOOLS_OUTPUT_H

// The tool's output model: every view fills sections of records once, and one
// renderer prints them as an aligned table, JSON or CSV.

#include <stdio.h>

#include <string>
#include <vector>

#include <nlohmann/json.hpp>

namespace Tool {

using Json = nlohmann::ordered_json;

enum class Format { Table, Json, Csv };

// The one marker a table or CSV shows for a value the controller did not give.
extern const char* const kNoValue;

struct Column {
    std::string key;    // JSON member and CSV header
    std::string label;  // table header or field name
    enum Use { Everywhere, TableOnly, DataOnly } use = Everywhere;
};

struct Section {
    std::string name;   // JSON member of the top-level object
    std::string title;  // heading of the table output
    // Columns: one row per line under a header. Fields: each record as
    // "label : value" lines (controller identity, one sensor's thresholds).
    enum Layout { Columns, Fields } layout = Columns;
    // JSON gives a lone record as an object rather than a one-element array.
    bool single = false;
    // Fields: leave out the fields a record does not have.
    bool omitMissing = false;
    std::vector<Column> columns;
    std::vector<Json> records;  // members named by the columns' keys; absent or null: no value
};

// A value as a table or CSV shows it: numbers without needless decimals,
// lists joined with ", ", null as kNoValue.
std::string cellText(const Json& value);

// CSV lines, for output that is printed record by record.
std::string csvHeader(const std::vector<Column>& columns);
std::string csvRow(const std::vector<Column>& columns, const Json& record);

void render(const std::vector<Section>& sections, Format format, FILE* out);

}  // namespace Tool

#endif
