#include <algorithm>
#include <iostream>

#include "cli/cli.h"

namespace cli {

void print_json(const Json::Value &value) {
    Json::StreamWriterBuilder builder;
    builder["indentation"] = "  ";
    std::cout << Json::writeString(builder, value) << "\n";
}

void print(const Table &table) {
    if (context().json) {
        Json::Value rows(Json::arrayValue);
        for (const auto &row : table.rows) {
            Json::Value obj(Json::objectValue);
            for (size_t i = 0; i < table.headers.size() && i < row.size(); ++i)
                obj[table.headers[i]] = row[i];
            rows.append(obj);
        }
        print_json(rows);
        return;
    }
    std::vector<size_t> width(table.headers.size());
    for (size_t i = 0; i < width.size(); ++i)
        width[i] = table.headers[i].size();
    for (const auto &row : table.rows)
        for (size_t i = 0; i < width.size() && i < row.size(); ++i)
            width[i] = std::max(width[i], row[i].size());
    auto line = [&](const std::vector<std::string> &cells) {
        std::string out;
        for (size_t i = 0; i < width.size(); ++i) {
            const std::string cell = i < cells.size() ? cells[i] : "";
            out += cell;
            if (i + 1 < width.size())
                out += std::string(width[i] - cell.size() + 2, ' ');
        }
        std::cout << out << "\n";
    };
    line(table.headers);
    for (const auto &row : table.rows)
        line(row);
}

void print_record(const std::vector<std::pair<std::string, Json::Value>> &fields) {
    if (context().json) {
        Json::Value obj(Json::objectValue);
        for (const auto &[name, value] : fields)
            obj[name] = value;
        print_json(obj);
        return;
    }
    size_t width = 0;
    for (const auto &field : fields)
        width = std::max(width, field.first.size());
    for (const auto &[name, value] : fields)
        std::cout << name << std::string(width - name.size() + 2, ' ') << value.asString() << "\n";
}

} // namespace cli
