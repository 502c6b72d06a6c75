// torvale db: the database itself.
#include <iostream>

#include "cli/cli.h"
#include "schema_sql.h"
#include "torvale/torvale.h"

namespace {

void setup() {
    CLI::App &db = cli::family("db", "The download database");
    db.add_subcommand("init", "Create the tables and indexes (harmless when they exist)")
        ->callback([] {
            if (DownloadDBConnect() == nullptr)
                cli::fail("cannot connect to the database \"download\" as \"admin\"");
            if (DownloadDBExec(kSchemaSql) == -1)
                cli::fail("applying the schema failed (see syslog)");
            if (!cli::context().json)
                std::cout << "schema applied\n";
            else
                cli::print_json(Json::Value(Json::objectValue));
        });
}

cli::Registration reg(setup);

} // namespace
