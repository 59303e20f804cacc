#include "Output.h"

#include <math.h>

#include <algorithm>

namespace Tool {

const char* const kNoValue = "na";

namespace {

bool shownIn(const Column& c, Format format) {
    if (format == Format::Table) return c.use != Column::DataOnly;
    return c.use != Column::TableOnly;
}

std::vector<const Column*> columnsFor(const Section& s, Format format) {
    std::vector<const Column*> out;
    for (const auto& c : s.columns)
        if (shownIn(c, format)) out.push_back(&c);
    return out;
}

const Json& member(const Json& record, const std::string& key) {
    static const Json none;
    auto it = record.find(key);
    return it == record.end() ? none : *it;
}

std::string csvField(const std::string& text) {
    if (text.find_first_of(",\"\n\r") == std::string::npos) return text;
    std::string out = "\"";
    for (char c : text) out += c == '"' ? std::string("\"\"") : std::string(1, c);
    return out + "\"";
}

void renderColumns(const Section& s, FILE* out) {
    const auto cols = columnsFor(s, Format::Table);
    std::vector<std::vector<std::string>> cells;
    std::vector<size_t> width;
    for (const Column* c : cols) width.push_back(c->label.size());
    for (const auto& r : s.records) {
        std::vector<std::string> row;
        for (size_t i = 0; i < cols.size(); ++i) {
            row.push_back(cellText(member(r, cols[i]->key)));
            width[i] = std::max(width[i], row.back().size());
        }
        cells.push_back(std::move(row));
    }
    auto line = [&](const std::vector<std::string>& row) {
        std::string text = " ";
        for (size_t i = 0; i < row.size(); ++i) {
            text += " " + row[i];
            if (i + 1 < row.size()) text += std::string(width[i] - row[i].size(), ' ') + " |";
        }
        fprintf(out, "%s\n", text.c_str());
    };
    std::vector<std::string> header;
    for (const Column* c : cols) header.push_back(c->label);
    line(header);
    for (const auto& row : cells) line(row);
}

void renderFields(const Section& s, FILE* out) {
    const auto cols = columnsFor(s, Format::Table);
    size_t width = 0;
    for (const Column* c : cols) width = std::max(width, c->label.size());
    bool first = true;
    for (const auto& r : s.records) {
        if (!first) fprintf(out, "\n");
        first = false;
        for (const Column* c : cols)
            if (!s.omitMissing || !member(r, c->key).is_null())
                fprintf(out, "  %-*s : %s\n", static_cast<int>(width), c->label.c_str(),
                    cellText(member(r, c->key)).c_str());
    }
}

void renderTable(const std::vector<Section>& sections, FILE* out) {
    for (const auto& s : sections) {
        fprintf(out, "%s\n", s.title.c_str());
        if (s.records.empty())
            fprintf(out, "  (none)\n");
        else if (s.layout == Section::Columns)
            renderColumns(s, out);
        else
            renderFields(s, out);
    }
}

void renderJson(const std::vector<Section>& sections, FILE* out) {
    Json top = Json::object();
    for (const auto& s : sections) {
        const auto cols = columnsFor(s, Format::Json);
        Json list = Json::array();
        for (const auto& r : s.records) {
            Json o = Json::object();
            for (const Column* c : cols) o[c->key] = member(r, c->key);
            list.push_back(std::move(o));
        }
        top[s.name] = s.single ? (list.empty() ? Json() : list[0]) : list;
    }
    fprintf(out, "%s\n", top.dump(2).c_str());
}

// One header row and the records under it; sections are parted by a blank line.
void renderCsv(const std::vector<Section>& sections, FILE* out) {
    bool first = true;
    for (const auto& s : sections) {
        if (!first) fprintf(out, "\n");
        first = false;
        fprintf(out, "%s\n", csvHeader(s.columns).c_str());
        for (const auto& r : s.records) fprintf(out, "%s\n", csvRow(s.columns, r).c_str());
    }
}

}  // namespace

std::string csvHeader(const std::vector<Column>& columns) {
    std::string line;
    for (const auto& c : columns)
        if (c.use != Column::TableOnly) line += (line.empty() ? "" : ",") + csvField(c.key);
    return line;
}

std::string csvRow(const std::vector<Column>& columns, const Json& record) {
    std::string line;
    bool first = true;
    for (const auto& c : columns) {
        if (c.use == Column::TableOnly) continue;
        line += (first ? "" : ",") + csvField(cellText(member(record, c.key)));
        first = false;
    }
    return line;
}

std::string cellText(const Json& v) {
    if (v.is_null()) return kNoValue;
    if (v.is_string()) return v.get<std::string>();
    if (v.is_boolean()) return v.get<bool>() ? "yes" : "no";
    if (v.is_number_integer()) return v.dump();
    if (v.is_number()) {
        const double d = v.get<double>();
        char text[48];
        // Whole values print without decimals, as the controller's own tools do.
        if (d == floor(d) && fabs(d) < 1e15)
            snprintf(text, sizeof text, "%.0f", d);
        else
            snprintf(text, sizeof text, "%.3f", d);
        return text;
    }
    if (v.is_array()) {
        if (v.empty()) return kNoValue;
        std::string out;
        for (const auto& e : v) out += (out.empty() ? "" : ", ") + cellText(e);
        return out;
    }
    return v.dump();
}

void render(const std::vector<Section>& sections, Format format, FILE* out) {
    switch (format) {
    case Format::Table: renderTable(sections, out); break;
    case Format::Json: renderJson(sections, out); break;
    case Format::Csv: renderCsv(sections, out); break;
    }
}

}  // namespace Tool
