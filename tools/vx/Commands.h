#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "Importer.h"
#include "JsonWriter.h"
#include "Search.h"

namespace vx {

// Where a query command writes besides its plain lines.
struct OutputOptions {
  bool json = false;  // JSON on stdout instead of the plain lines
  std::string html;   // a report page written to this path when not empty
};

// The commands of `vx`. Each opens the database, does its work, prints to stdout (problems to
// stderr) and returns the process's exit code.
int CreateCommand(const std::string& db, uint32_t thumbSide, uint32_t thumbQuality, bool force);
int ImportCommand(const std::string& db, const std::vector<std::string>& dirs,
                  const ImportOptions& options, bool json);
int SimilarCommand(const std::string& db, const std::string& image, const SearchOptions& options,
                   const OutputOptions& output);
int DupesCommand(const std::string& db, const SearchOptions& options, const OutputOptions& output);
int LsCommand(const std::string& db, const std::string& folder, const std::string& category,
              bool json);
int InfoCommand(const std::string& db, const std::string& file, bool json);
int StatsCommand(const std::string& db, bool json);

int CategoryAddCommand(const std::string& db, const std::string& name, const std::string& parent,
                       const std::string& tag);
int CategoryFormulaCommand(const std::string& db, const std::string& name,
                           const std::string& formula);
int CategoryAssignCommand(const std::string& db, const std::string& name,
                          const std::vector<std::string>& files, bool remove);
int CategoryFilesCommand(const std::string& db, const std::string& name, bool json);
int CategoryTreeCommand(const std::string& db, bool json);

// Shared by the commands: a file as a JSON object, {"oid", "path", "width", "height", "size",
// "format"}, and the files of a list as JSON or as one path a line.
void WriteFileJson(vxhost::JsonWriter& json, Database& db, uint32_t oid);
void PrintFiles(Database& db, const std::vector<uint32_t>& oids, bool json);

}  // namespace vx
