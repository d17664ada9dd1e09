// vx: the command-line host of vxcore3. Creates databases, imports folder trees and answers
// similarity, duplicate and catalog queries. Exit codes: 0 success, 1 the database or an
// operation of it failed, 2 usage error, 3 a named file, folder or category is unknown.

#include <CLI/CLI.hpp>

#include <cstdio>
#include <string>
#include <vector>

#include "Commands.h"

namespace {

// What the search commands share: method, rotation, limits and outputs.
struct SearchArgs {
  std::string method = "quick";
  bool rotate = false;
  uint32_t max = 20;
  double minScore = -1;  // negative: not given
  bool json = false;
  std::string html;
};

void AddSearchOptions(CLI::App* app, SearchArgs* args, bool withMax) {
  app->add_option("--method", args->method, "quick, fuzzy, histogram or duplicates")
      ->capture_default_str()
      ->check(CLI::IsMember({"quick", "fuzzy", "histogram", "duplicates"}));
  app->add_flag("--rotate", args->rotate, "also match the image turned by 90, 180, 270 degrees");
  if (withMax) {
    app->add_option("--max", args->max, "most hits to list")->check(CLI::Range(1, 32000));
  }
  app->add_option("--min-score", args->minScore,
                  "lowest score (0 to 100); for dupes the method's tuned cut by default")
      ->check(CLI::Range(0.0, 100.0));
  app->add_flag("--json", args->json, "print JSON");
  app->add_option("--html", args->html, "write an HTML report with thumbnails to this file");
}

vx::SearchOptions ToSearchOptions(const SearchArgs& args) {
  vx::SearchOptions options;
  vx::Search::ParseMethod(args.method, &options.method);
  options.rotate = args.rotate;
  options.maxResults = args.max;
  options.hasMinScore = args.minScore >= 0;
  options.minScore = options.hasMinScore ? args.minScore : 0;
  return options;
}

// The command line, parsed and run.
int Run(int argc, char** argv) {
  CLI::App app{"vx: an image database on the command line"};
  app.require_subcommand(1);
  app.footer(
      "Exit codes: 0 success, 1 failure, 2 usage error, 3 file, folder or category unknown.");
  std::string db;
  int result = vx::kExitOk;

  auto* create = app.add_subcommand("create", "create an empty database");
  uint32_t thumbSide = 256, thumbQuality = 85;
  bool force = false;
  create->add_option("DB", db, "database file (e.g. photos.vxm)")->required();
  create->add_option("--thumb-size", thumbSide, "longest side of thumbnails")
      ->check(CLI::Range(40, 1024));
  create->add_option("--thumb-quality", thumbQuality, "JPEG quality of thumbnails")
      ->check(CLI::Range(1, 100));
  create->add_flag("--force", force, "replace an existing database");
  create->callback([&] { result = vx::CreateCommand(db, thumbSide, thumbQuality, force); });

  auto* importCommand = app.add_subcommand("import", "add or update the images of folder trees");
  std::vector<std::string> dirs;
  vx::ImportOptions importOptions;
  bool importJson = false, plain = false, quiet = false;
  importCommand->add_option("DB", db, "database file")->required();
  importCommand->add_option("DIR", dirs, "folders to walk")->required();
  importCommand->add_option("-j,--jobs", importOptions.threads,
                            "decoding threads (default: all cores)");
  importCommand->add_flag("--plain", plain, "plain progress lines even on a terminal");
  importCommand->add_flag("-q,--quiet", quiet, "no progress");
  importCommand->add_flag("--json", importJson, "print the summary as JSON");
  importCommand->callback([&] {
    if (plain) importOptions.progress = vxhost::Progress::Mode::kPlain;
    importOptions.showProgress = !quiet;
    result = vx::ImportCommand(db, dirs, importOptions, importJson);
  });

  auto* similar = app.add_subcommand("similar", "list the images most similar to one image");
  std::string image;
  SearchArgs similarArgs;
  similar->add_option("DB", db, "database file")->required();
  similar->add_option("IMAGE", image, "a file of the database (path or OID) or any image file")
      ->required();
  AddSearchOptions(similar, &similarArgs, true);
  similar->callback([&] {
    vx::OutputOptions out{similarArgs.json, similarArgs.html};
    result = vx::SimilarCommand(db, image, ToSearchOptions(similarArgs), out);
  });

  auto* dupes = app.add_subcommand("dupes", "list groups of near-duplicates, one group a line");
  SearchArgs dupesArgs;
  dupesArgs.method = vx::Search::MethodName(vx::Search::kDupeMethod);
  dupes->add_option("DB", db, "database file")->required();
  AddSearchOptions(dupes, &dupesArgs, false);
  dupes->callback([&] {
    vx::SearchOptions options = ToSearchOptions(dupesArgs);
    options.maxResults = 10;
    options.hasMinScore = true;
    if (dupesArgs.minScore < 0) {
      options.minScore = vx::Search::DupeThreshold(options.method, options.rotate);
    }
    result = vx::DupesCommand(db, options, {dupesArgs.json, dupesArgs.html});
  });

  auto* ls = app.add_subcommand("ls", "list the files of the database, a folder or a category");
  std::string folder, category;
  bool lsJson = false;
  ls->add_option("DB", db, "database file")->required();
  auto* folderOpt = ls->add_option("FOLDER", folder, "a folder of the database (recursive)");
  ls->add_option("--category", category, "full name of a category")->excludes(folderOpt);
  ls->add_flag("--json", lsJson, "print JSON");
  ls->callback([&] { result = vx::LsCommand(db, folder, category, lsJson); });

  auto* info = app.add_subcommand("info", "show a file's record, properties and XMP");
  std::string file;
  bool infoJson = false;
  info->add_option("DB", db, "database file")->required();
  info->add_option("FILE", file, "path or OID")->required();
  info->add_flag("--json", infoJson, "print JSON");
  info->callback([&] { result = vx::InfoCommand(db, file, infoJson); });

  auto* stats = app.add_subcommand("stats", "show counts and store sizes");
  bool statsJson = false;
  stats->add_option("DB", db, "database file")->required();
  stats->add_flag("--json", statsJson, "print JSON");
  stats->callback([&] { result = vx::StatsCommand(db, statsJson); });

  auto* cat = app.add_subcommand("category", "manage categories");
  cat->require_subcommand(1);
  std::string name, parent, tag, formula;
  std::vector<std::string> files;
  bool remove = false, catJson = false;
  auto* add = cat->add_subcommand("add", "add a category; prints its OID");
  add->add_option("DB", db, "database file")->required();
  add->add_option("NAME", name, "name of the category")->required();
  add->add_option("--parent", parent, "full name of the parent category");
  add->add_option("--tag", tag, "take child categories from this tag's values (e.g. dc:subject)");
  add->callback([&] { result = vx::CategoryAddCommand(db, name, parent, tag); });
  auto* form = cat->add_subcommand("formula", "set a category's formula");
  form->add_option("DB", db, "database file")->required();
  form->add_option("NAME", name, "full name of the category")->required();
  form->add_option("FORMULA", formula, "e.g. '\"Trips\" OR \"Alps\" NOT \"Family\"'")->required();
  form->callback([&] { result = vx::CategoryFormulaCommand(db, name, formula); });
  auto* assign = cat->add_subcommand("assign", "put files into a category by hand");
  assign->add_option("DB", db, "database file")->required();
  assign->add_option("NAME", name, "full name of the category")->required();
  assign->add_option("FILE", files, "paths or OIDs")->required();
  assign->add_flag("--remove", remove, "take the files out instead");
  assign->callback([&] { result = vx::CategoryAssignCommand(db, name, files, remove); });
  auto* catFiles = cat->add_subcommand("files", "list a category's files");
  catFiles->add_option("DB", db, "database file")->required();
  catFiles->add_option("NAME", name, "full name of the category")->required();
  catFiles->add_flag("--json", catJson, "print JSON");
  catFiles->callback([&] { result = vx::CategoryFilesCommand(db, name, catJson); });
  auto* tree = cat->add_subcommand("tree", "show the category tree with file counts");
  tree->add_option("DB", db, "database file")->required();
  tree->add_flag("--json", catJson, "print JSON");
  tree->callback([&] { result = vx::CategoryTreeCommand(db, catJson); });

  try {
    app.parse(argc, argv);
  } catch (const CLI::CallForHelp& e) {
    return app.exit(e);
  } catch (const CLI::CallForAllHelp& e) {
    return app.exit(e);
  } catch (const CLI::ParseError& e) {
    app.exit(e);
    return vx::kExitUsage;
  }
  return result;
}

}  // namespace

int main(int argc, char** argv) {
  // A command reports its own failures; what escapes it (memory, the terminal) still ends the
  // process with the failure code rather than an abort.
  try {
    return Run(argc, argv);
  } catch (const std::exception& e) {
    std::fprintf(stderr, "vx: %s\n", e.what());
  } catch (...) {
    std::fprintf(stderr, "vx: unexpected failure\n");
  }
  return vx::kExitFailure;
}
