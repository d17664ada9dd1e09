#include <cstdio>
#include <functional>
#include <iostream>
#include <map>

#include "Commands.h"

namespace vx {

namespace {

// Opens the database for writing and finds the category; prints why not.
int OpenWithCategory(Database& db, const std::string& path, const std::string& name, bool readOnly,
                     uint32_t* oid) {
  if (!db.Open(path, readOnly)) return kExitFailure;
  *oid = db.FindCategory(name);
  if (*oid != 0) return kExitOk;
  std::fprintf(stderr, "vx: no category %s\n", name.c_str());
  return kExitNotFound;
}

// A tag value as the full-text index's exact query takes it: in double quotes, inner ones
// doubled.
std::string QuotedLiteral(const std::string& value) {
  std::string quoted = "\"";
  for (char c : value) quoted += c == '"' ? std::string("\"\"") : std::string(1, c);
  return quoted + "\"";
}

// What a formula error code means to someone typing a formula.
const char* FormulaErrorText(unsigned code) {
  switch (code) {
    case 15004:
      return "\")\" without \"(\"";
    case 15005:
      return "\"(\" without \")\"";
    case 15010:
      return "no such category";
    case 15011:
      return "no such folder";
    case 15012:
      return "no such saved selection";
    case 15014:
      return "the category would depend on itself";
    default:
      return "syntax error: operands are quoted, operators are AND, OR and the binary NOT";
  }
}

}  // namespace

int CategoryAddCommand(const std::string& path, const std::string& name, const std::string& parent,
                       const std::string& tag) {
  Database db;
  uint32_t parentOid = 0;
  int rc = parent.empty() ? (db.Open(path, false) ? kExitOk : kExitFailure)
                          : OpenWithCategory(db, path, parent, false, &parentOid);
  if (rc != kExitOk) return rc;
  if (unsigned valid = db.engine().IsValidGroupName(name, parentOid); valid != VX_OK) {
    std::fprintf(stderr, "vx: %s: %s\n", name.c_str(),
                 valid == 10124 ? "the name is taken" : "not a valid category name");
    return kExitUsage;
  }
  CVXGroup group;
  group.Name() = name;
  group.Parent() = parentOid;
  // A category with a tag takes its children from the values of that tag.
  group.FTITag() = tag;
  if (unsigned added = db.engine().AddGroup(group); added != VX_OK) {
    std::fprintf(stderr, "vx: cannot add category %s (error %u)\n", name.c_str(), added);
    return kExitFailure;
  }
  std::printf("%u\n", group.Oid());
  return kExitOk;
}

int CategoryFormulaCommand(const std::string& path, const std::string& name,
                           const std::string& formula) {
  Database db;
  uint32_t oid = 0;
  if (int rc = OpenWithCategory(db, path, name, false, &oid); rc != kExitOk) return rc;
  CVXGroup group;
  db.engine().GetGroup(oid, group);
  const SError error = group.SetExpression(db.catalog(), formula);
  if (error.code != VX_OK) {
    std::fprintf(stderr, "vx: formula error %u at %d: %s\n", error.code, error.position,
                 FormulaErrorText(error.code));
    return kExitUsage;
  }
  if (unsigned rc = db.engine().SetGroup(group); rc != VX_OK) {
    std::fprintf(stderr, "vx: cannot store category %s (error %u)\n", name.c_str(), rc);
    return kExitFailure;
  }
  return kExitOk;
}

int CategoryAssignCommand(const std::string& path, const std::string& name,
                          const std::vector<std::string>& files, bool remove) {
  Database db;
  uint32_t oid = 0;
  if (int rc = OpenWithCategory(db, path, name, false, &oid); rc != kExitOk) return rc;
  std::vector<uint32_t> oids;
  for (const std::string& file : files) {
    const uint32_t f = db.FindFile(file);
    if (f == 0) {
      std::fprintf(stderr, "vx: no file %s in the database\n", file.c_str());
      return kExitNotFound;
    }
    oids.push_back(f);
  }
  CVXGroup group;
  db.engine().GetGroup(oid, group);
  if (remove) {
    group.RemoveImage(oids);
  } else {
    group.AddImage(db.catalog(), oids);  // 10120 when all were there already: no failure
  }
  if (unsigned rc = db.engine().SetGroup(group); rc != VX_OK) {
    std::fprintf(stderr, "vx: cannot store category %s (error %u)\n", name.c_str(), rc);
    return kExitFailure;
  }
  return kExitOk;
}

int CategoryFilesCommand(const std::string& path, const std::string& name, bool json) {
  Database db;
  uint32_t oid = 0;
  if (int rc = OpenWithCategory(db, path, name, true, &oid); rc != kExitOk) return rc;
  std::vector<uint32_t> files;
  if (unsigned rc = db.engine().GetGroupImages(oid, files); rc != VX_OK) {
    std::fprintf(stderr, "vx: category %s cannot be computed (error %u)\n", name.c_str(), rc);
    return kExitFailure;
  }
  PrintFiles(db, files, json);
  return kExitOk;
}

// Categories by parent, each with its number of files; a category with a tag lists the values
// of that tag as its data-driven children.
int CategoryTreeCommand(const std::string& path, bool json) {
  Database db;
  if (!db.Open(path, true)) return kExitFailure;
  std::vector<uint32_t> oids;
  db.engine().GetGroups(oids);
  std::map<uint32_t, std::vector<CVXGroup>> children;
  for (uint32_t oid : oids) {
    CVXGroup group;
    if (db.engine().GetGroup(oid, group) == VX_OK && oid != VX_ALL_GROUP_OID) {
      children[group.Parent()].push_back(group);
    }
  }
  vxhost::JsonWriter w(std::cout);
  std::function<void(uint32_t, int)> walk = [&](uint32_t parent, int depth) {
    for (const CVXGroup& group : children[parent]) {
      std::vector<uint32_t> files;
      db.engine().GetGroupImages(group.Oid(), files);
      // The values of a tag-driven category, each with the number of files that carry it.
      std::vector<std::string> values;
      if (group.IsFTIRoot()) db.engine().GroupXMPFTITags(group.FTITag(), values, 0, 0);
      std::vector<size_t> counts;
      for (const std::string& v : values) {
        std::vector<uint32_t> carriers;
        db.engine().FindXMPFTI(group.FTITag().c_str(), QuotedLiteral(v).c_str(), 0, carriers, 0, 0);
        counts.push_back(carriers.size());
      }
      if (json) {
        w.BeginObject().Key("oid").UInt(group.Oid()).Key("name").String(group.Name());
        w.Key("files").UInt(files.size()).Key("formula").String(group.Expression(db.catalog()));
        w.Key("values").BeginArray();
        for (size_t i = 0; i < values.size(); ++i) {
          w.BeginObject().Key("value").String(values[i]).Key("files").UInt(counts[i]).EndObject();
        }
        w.EndArray().Key("children").BeginArray();
        walk(group.Oid(), depth + 1);
        w.EndArray().EndObject();
        continue;
      }
      std::printf("%*s%s (%zu)\n", depth * 2, "", group.Name().c_str(), files.size());
      for (size_t i = 0; i < values.size(); ++i) {
        std::printf("%*s= %s (%zu)\n", depth * 2 + 2, "", values[i].c_str(), counts[i]);
      }
      walk(group.Oid(), depth + 1);
    }
  };
  if (json) w.BeginArray();
  walk(0, 0);
  if (json) {
    w.EndArray();
    std::cout << "\n";
  }
  return kExitOk;
}

}  // namespace vx
