#include "daemons/searchd/sqlite_index.h"

#include <cctype>
#include <cstdlib>
#include <cstring>
#include <set>
#include <variant>

#include "common/json_util.h"
#include "daemons/searchd/categories.h"
#include "daemons/searchd/error_codes.h"
#include "daemons/searchd/text_fold.h"

namespace vellis::searchd {
namespace {

// Fields that feed the sort and filter columns.
constexpr char kNameField[] = "QORUMDFSName";
constexpr char kExtensionField[] = "QORUMDExtension";
constexpr char kSizeField[] = "QORUMDFSSize";
constexpr char kModifiedField[] = "QORUMDFSContentChangeDate";
constexpr char kModifiedAltField[] = "QORUMDContentModificationDate";
// Fields whose words become suggestion terms.
constexpr const char* kSuggestFields[] = {"QORUMDTitle", "QORUMDKeywords", "QORUMDAuthors",
                                          "QORUMDAlbum", "QORUMDDisplayName"};

// Snippet length in tokens, and the plain excerpt used when no query word
// falls into the text.
constexpr int kSnippetTokens = 24;
constexpr size_t kExcerptBytes = 200;
// Segments that FTS5 lets accumulate on a level before merging them.
constexpr int kAutomerge = 8;
constexpr int kPageSize = 8192;
constexpr int64_t kWalKeepBytes = 16LL * 1024 * 1024;
// Reads through a memory map instead of read() calls (address space only).
constexpr int64_t kMmapBytes = 256LL * 1024 * 1024;
// The most matches that a search ranks by relevance (see Search).
constexpr int64_t kMaxRankedMatches = 5000;
// Page cache per open index, in KiB.
constexpr int kCacheKiB = 32 * 1024;

// Every string that begins with `prefix` sorts below this bound: the byte
// 0xF5 never occurs in UTF-8, and the JSON parser admits only UTF-8.
std::string PrefixUpperBound(const std::string& prefix) { return prefix + "\xF5"; }

std::string Basename(const std::string& path) {
  size_t slash = path.rfind('/');
  return slash == std::string::npos ? path : path.substr(slash + 1);
}

std::string LowerAscii(std::string s) {
  for (char& c : s) c = static_cast<char>(tolower(static_cast<unsigned char>(c)));
  return s;
}

std::optional<int64_t> IntField(const Json::Value& doc, const char* field) {
  const Json::Value& v = doc[field];
  if (v.isIntegral() && !v.isBool()) return v.asInt64();
  return std::nullopt;
}

// fold(x): the case-folded text, for substring tests in SQL.
void FoldFunction(sqlite3_context* ctx, int, sqlite3_value** argv) {
  const unsigned char* p = sqlite3_value_text(argv[0]);
  if (p == nullptr) {
    sqlite3_result_null(ctx);
    return;
  }
  std::string folded = FoldCase(std::string(reinterpret_cast<const char*>(p),
                                            static_cast<size_t>(sqlite3_value_bytes(argv[0]))));
  sqlite3_result_text(ctx, folded.data(), static_cast<int>(folded.size()), SQLITE_TRANSIENT);
}

using Bound = std::variant<std::string, int64_t, double>;

struct Where {
  std::string sql;  // " AND ..." pieces
  std::vector<Bound> binds;
  void Add(const std::string& cond, std::vector<Bound> b = {}) {
    sql += " AND " + cond;
    for (auto& x : b) binds.push_back(std::move(x));
  }
};

void BindAll(Stmt& st, const std::vector<Bound>& binds, int first) {
  int i = first;
  for (const Bound& b : binds) {
    if (std::holds_alternative<std::string>(b)) st.Bind(i, std::get<std::string>(b));
    if (std::holds_alternative<int64_t>(b)) st.Bind(i, std::get<int64_t>(b));
    if (std::holds_alternative<double>(b)) st.BindDouble(i, std::get<double>(b));
    ++i;
  }
}

std::string Star(const QueryTerm& t) { return t.kind == QueryTerm::Kind::kPrefix ? " *" : ""; }

// The FTS5 expression of a catch-all term: its words under the standard
// analyzer, or its blank-split tokens among keyword and white-space fields.
std::string CatchAllExpr(const QueryTerm& t) {
  std::string expr = "({std_all content} : " + FtsQuote(t.text) + Star(t) + ")";
  std::string folded = FoldCase(t.text);
  expr += " OR ({ws_all} : " + FtsQuote(HexToken(folded)) + Star(t) + ")";
  if (t.kind == QueryTerm::Kind::kPhrase) {
    std::string tokens;
    for (const std::string& tok : SplitBlanks(folded)) tokens += HexToken(tok) + " ";
    expr += " OR ({ws_all} : " + FtsQuote(tokens) + ")";
  }
  return expr;
}

}  // namespace

SqliteIndex::SqliteIndex(const std::string& file, const IndexConfig* config, int busy_timeout_ms)
    : db_(std::make_unique<Db>(file, config != nullptr, busy_timeout_ms)) {
  // Larger pages suit full-text segments; this only takes effect on a new
  // database.
  db_->Exec("PRAGMA page_size=" + std::to_string(kPageSize));
  // WAL with FULL sync: a commit returns only after the log is on disk.
  db_->Exec("PRAGMA journal_mode=WAL");
  db_->Exec("PRAGMA synchronous=FULL");
  // Full-text merges revisit many pages: a larger cache saves rereading them.
  db_->Exec("PRAGMA cache_size=-" + std::to_string(kCacheKiB));
  db_->Exec("PRAGMA mmap_size=" + std::to_string(kMmapBytes));
  // The log file is cut back after a checkpoint instead of keeping the size
  // of the largest transaction.
  db_->Exec("PRAGMA journal_size_limit=" + std::to_string(kWalKeepBytes));
  sqlite3_create_function(db_->get(), "fold", 1, SQLITE_UTF8 | SQLITE_DETERMINISTIC, nullptr,
                          FoldFunction, nullptr, nullptr);
  CreateTables();
  // Fewer, larger merges of full-text segments while documents stream in.
  // Idle-time merges (Merge) combine any two segments of a level.
  for (const char* table : {"fts", "fts_name"}) {
    std::string t = table;
    db_->Exec("INSERT INTO " + t + "(" + t + ", rank) VALUES ('automerge', " +
              std::to_string(kAutomerge) + ")");
    db_->Exec("INSERT INTO " + t + "(" + t + ", rank) VALUES ('usermerge', 2)");
  }
  Json::Value mappings;
  Stmt& get = Cached("SELECT value FROM meta WHERE key = 'mappings'");
  if (get.Step()) {
    std::string text = get.Text(0);
    get.Reset();
    if (!JsonFromString(mappings, text)) {
      throw Error(kErrStorage, "Index database " + file + " holds unreadable mappings");
    }
  } else {
    get.Reset();
    if (config == nullptr) throw Error(kErrStorage, "Index database " + file + " has no schema");
    mappings = config->mappings;
    schema_ = Schema::FromMappings(mappings);
    Stmt put(db_->get(), "INSERT INTO meta(key, value) VALUES (?, ?)");
    for (const auto& [key, value] :
         {std::pair<const char*, const Json::Value*>{"mappings", &config->mappings},
          {"settings", &config->settings},
          {"event_handler", &config->event_handler}}) {
      put.Bind(1, std::string(key)).Bind(2, JsonToString(*value)).Run();
      put.Reset();
    }
    return;
  }
  schema_ = Schema::FromMappings(mappings);
}

SqliteIndex::~SqliteIndex() {
  cache_.clear();
  if (sqlite3_get_autocommit(db_->get()) == 0)
    sqlite3_exec(db_->get(), "ROLLBACK", nullptr, nullptr, nullptr);
}

Stmt& SqliteIndex::Cached(const std::string& sql) {
  auto it = cache_.find(sql);
  if (it == cache_.end()) {
    it = cache_.emplace(sql, std::make_unique<Stmt>(db_->get(), sql)).first;
  }
  it->second->Reset();
  return *it->second;
}

void SqliteIndex::CreateTables() {
  db_->Exec(
      "CREATE TABLE IF NOT EXISTS meta(key TEXT PRIMARY KEY, value TEXT NOT NULL);"
      // Small columns first: filters then never read through the body.
      "CREATE TABLE IF NOT EXISTS docs(rid INTEGER PRIMARY KEY, doc_id TEXT NOT NULL UNIQUE,"
      " name TEXT NOT NULL, ext TEXT NOT NULL, size INTEGER, mtime INTEGER,"
      " has_content INTEGER NOT NULL, body TEXT NOT NULL);"
      // Only the name order is indexed (browsing a folder by name); other
      // sorts and filters work on the matching rows, and every index costs
      // each write.
      "CREATE INDEX IF NOT EXISTS docs_name ON docs(name COLLATE NOCASE);"
      "CREATE VIRTUAL TABLE IF NOT EXISTS fts USING fts5(std_all, content, ws_all, kw,"
      " tokenize = 'unicode61 remove_diacritics 2');"
      "CREATE VIRTUAL TABLE IF NOT EXISTS fts_name USING fts5(name, tokenize = 'trigram');"
      "CREATE TABLE IF NOT EXISTS suggest(term TEXT PRIMARY KEY, docs INTEGER NOT NULL)"
      " WITHOUT ROWID;"
      "CREATE TABLE IF NOT EXISTS suggest_doc(doc_id TEXT NOT NULL, term TEXT NOT NULL,"
      " PRIMARY KEY(doc_id, term)) WITHOUT ROWID;");
}

void SqliteIndex::BeginWrite() {
  if (sqlite3_get_autocommit(db_->get()) != 0) db_->Exec("BEGIN IMMEDIATE");
  merge_pending_ = true;
}

template <typename Fn>
void SqliteIndex::Atomically(Fn&& fn) {
  BeginWrite();
  try {
    fn();
  } catch (...) {
    // Only the storage fails here (documents are checked before writing).
    // A savepoint per document would undo just this one, but it makes FTS5
    // flush its pending terms to disk at every document, which triples the
    // cost of a write; so the open transaction is rolled back instead and
    // the next commit reports the loss.
    sqlite3_exec(db_->get(), "ROLLBACK", nullptr, nullptr, nullptr);
    lost_writes_ = true;
    throw;
  }
}

Json::Value SqliteIndex::RowDocument(const std::string& body, bool has_content, int64_t rid) {
  Json::Value doc;
  if (!JsonFromString(doc, body)) throw Error(kErrStorage, "Stored document is unreadable");
  if (has_content) {
    Stmt& st = Cached("SELECT content FROM fts WHERE rowid = ?");
    st.Bind(1, rid);
    if (st.Step()) doc[kContentField] = st.Text(0);
    st.Reset();
  }
  return doc;
}

std::optional<SqliteIndex::Stored> SqliteIndex::Load(const std::string& doc_id) {
  Stmt& st = Cached("SELECT rid, body, has_content FROM docs WHERE doc_id = ?");
  st.Bind(1, doc_id);
  if (!st.Step()) return std::nullopt;
  Stored s;
  s.rid = st.Int(0);
  std::string body = st.Text(1);
  bool has_content = st.Int(2) != 0;
  st.Reset();
  s.doc = RowDocument(body, has_content, s.rid);
  return s;
}

void SqliteIndex::DeleteRow(int64_t rid) {
  Cached("DELETE FROM fts WHERE rowid = ?").Bind(1, rid).Run();
  Cached("DELETE FROM fts_name WHERE rowid = ?").Bind(1, rid).Run();
  Cached("DELETE FROM docs WHERE rid = ?").Bind(1, rid).Run();
}

void SqliteIndex::WriteRow(int64_t rid, const std::string& doc_id, Json::Value doc) {
  // Reads go through a const view: operator[] on the value itself would
  // add the members it looks for.
  const Json::Value& view = doc;
  IndexedForms forms = schema_.Analyze(view);
  // The text content lives once, in the full-text table, when it is indexed
  // there whole; the row keeps the rest of the document.
  const Json::Value* content = doc.find(kContentField, kContentField + strlen(kContentField));
  bool has_content = content != nullptr && content->isString() && !forms.content.empty() &&
                     forms.content == content->asString();

  std::string name = view[kNameField].isString() ? view[kNameField].asString() : Basename(doc_id);
  std::string ext;
  if (view[kExtensionField].isString()) {
    ext = LowerAscii(view[kExtensionField].asString());
  } else if (size_t dot = name.rfind('.'); dot != std::string::npos) {
    ext = LowerAscii(name.substr(dot + 1));
  }
  std::optional<int64_t> size = IntField(view, kSizeField);
  std::optional<int64_t> mtime = IntField(view, kModifiedField);
  if (!mtime) mtime = IntField(view, kModifiedAltField);

  if (rid != 0) {
    Cached("DELETE FROM fts WHERE rowid = ?").Bind(1, rid).Run();
    Cached("DELETE FROM fts_name WHERE rowid = ?").Bind(1, rid).Run();
  }
  Stmt& put = Cached(
      "INSERT INTO docs(rid, doc_id, body, has_content, name, ext, size, mtime)"
      " VALUES (?, ?, ?, ?, ?, ?, ?, ?) ON CONFLICT(rid) DO UPDATE SET doc_id = excluded.doc_id,"
      " body = excluded.body, has_content = excluded.has_content, name = excluded.name,"
      " ext = excluded.ext, size = excluded.size, mtime = excluded.mtime");
  if (rid != 0) {
    put.Bind(1, rid);
  } else {
    put.BindNull(1);
  }
  if (has_content) doc.removeMember(kContentField);
  put.Bind(2, doc_id).Bind(3, JsonToString(doc)).Bind(4, static_cast<int64_t>(has_content));
  put.Bind(5, name).Bind(6, ext);
  if (size) put.Bind(7, *size);
  if (mtime) put.Bind(8, *mtime);
  put.Run();
  if (rid == 0) rid = db_->LastInsertRowid();
  Cached("INSERT INTO fts(rowid, std_all, content, ws_all, kw) VALUES (?, ?, ?, ?, ?)")
      .Bind(1, rid)
      .Bind(2, forms.std_all)
      .Bind(3, forms.content)
      .Bind(4, forms.ws_all)
      .Bind(5, forms.kw)
      .Run();
  if (!forms.name.empty()) {
    Cached("INSERT INTO fts_name(rowid, name) VALUES (?, ?)")
        .Bind(1, rid)
        .Bind(2, forms.name)
        .Run();
  }
}

void SqliteIndex::Upsert(const std::string& doc_id, const Json::Value& doc) {
  Json::Value normal = doc;
  const std::string& pid = schema_.property_id();
  if (normal.isObject() && !normal.isMember(pid)) normal[pid] = doc_id;
  normal = schema_.Normalize(std::move(normal));
  if (ValueText(normal[pid]) != doc_id) {
    throw Error(kErrBadMember, "doc_id \"" + doc_id + "\" differs from the document's " + pid +
                                   " " + JsonToString(normal[pid]));
  }
  Atomically([&] {
    Stmt& find = Cached("SELECT rid FROM docs WHERE doc_id = ?");
    find.Bind(1, doc_id);
    int64_t rid = find.Step() ? find.Int(0) : 0;
    find.Reset();
    WriteRow(rid, doc_id, std::move(normal));
  });
}

void SqliteIndex::Update(const std::string& doc_id, const Json::Value& fields) {
  if (!fields.isObject()) throw Error(kErrBadMember, "\"data\" must be an object of fields");
  std::optional<Stored> old = Load(doc_id);
  if (!old) throw Error(kErrDocumentNotFound, "No document " + doc_id);
  Json::Value merged = old->doc;
  for (const std::string& name : fields.getMemberNames()) {
    if (fields[name].isNull()) {
      merged.removeMember(name);
    } else {
      merged[name] = fields[name];
    }
  }
  merged = schema_.Normalize(std::move(merged));
  const std::string& pid = schema_.property_id();
  std::string new_id = ValueText(merged[pid]);
  if (new_id.empty()) throw Error(kErrBadMember, "The document's " + pid + " must not be empty");
  Atomically([&] {
    if (new_id != doc_id) {
      // Moving onto an existing identity replaces that document, as moving
      // a file over another does.
      Stmt& find = Cached("SELECT rid FROM docs WHERE doc_id = ?");
      find.Bind(1, new_id);
      int64_t other = find.Step() ? find.Int(0) : 0;
      find.Reset();
      if (other != 0) DeleteRow(other);
    }
    WriteRow(old->rid, new_id, std::move(merged));
  });
}

bool SqliteIndex::Delete(const std::string& doc_id) {
  bool found = false;
  Atomically([&] {
    Stmt& find = Cached("SELECT rid FROM docs WHERE doc_id = ?");
    find.Bind(1, doc_id);
    int64_t rid = find.Step() ? find.Int(0) : 0;
    find.Reset();
    if (rid == 0) return;
    found = true;
    DeleteRow(rid);
    Cached(
        "UPDATE suggest SET docs = docs - 1 WHERE term IN"
        " (SELECT term FROM suggest_doc WHERE doc_id = ?)")
        .Bind(1, doc_id)
        .Run();
    Cached("DELETE FROM suggest WHERE docs <= 0").Run();
    Cached("DELETE FROM suggest_doc WHERE doc_id = ?").Bind(1, doc_id).Run();
  });
  return found;
}

void SqliteIndex::CheckPrefixField(const std::string& field) const {
  if (field != schema_.property_id()) {
    throw Error(kErrBadQuery, "Prefix queries are supported on " + schema_.property_id() +
                                  " only, not on " + field);
  }
}

int64_t SqliteIndex::DeleteByPrefix(const std::string& field, const std::string& prefix) {
  CheckPrefixField(field);
  int64_t count = 0;
  Atomically([&] {
    const char* range = " (SELECT rid FROM docs WHERE doc_id >= ? AND doc_id < ?)";
    std::string upper = PrefixUpperBound(prefix);
    Cached(std::string("DELETE FROM fts WHERE rowid IN") + range)
        .Bind(1, prefix)
        .Bind(2, upper)
        .Run();
    Cached(std::string("DELETE FROM fts_name WHERE rowid IN") + range)
        .Bind(1, prefix)
        .Bind(2, upper)
        .Run();
    count = Cached("DELETE FROM docs WHERE doc_id >= ? AND doc_id < ?")
                .Bind(1, prefix)
                .Bind(2, upper)
                .Run();
  });
  return count;
}

Json::Value SqliteIndex::Project(const Json::Value& doc, const std::vector<std::string>& fields,
                                 bool include_content) const {
  Json::Value out(Json::objectValue);
  if (fields.empty()) {
    for (const std::string& name : doc.getMemberNames()) {
      if (!schema_.Options(name).stored) continue;
      if (name == kContentField && !include_content) continue;
      out[name] = doc[name];
    }
    return out;
  }
  for (const std::string& name : fields) {
    if (doc.isMember(name) && schema_.Options(name).stored) out[name] = doc[name];
  }
  return out;
}

Json::Value SqliteIndex::GetByPrefix(const std::string& field, const std::string& prefix,
                                     const std::vector<std::string>& load_fields,
                                     const std::string& after, int64_t limit) {
  CheckPrefixField(field);
  Json::Value out(Json::arrayValue);
  bool want_content = load_fields.empty();
  for (const std::string& f : load_fields) want_content = want_content || f == kContentField;
  Stmt st(db_->get(),
          "SELECT rid, body, has_content FROM docs WHERE doc_id >= ? AND doc_id < ? AND doc_id > ?"
          " ORDER BY doc_id LIMIT ?");
  st.Bind(1, prefix)
      .Bind(2, PrefixUpperBound(prefix))
      .Bind(3, after)
      .Bind(4, limit > 0 ? limit : int64_t{-1});
  while (st.Step()) {
    Json::Value doc = RowDocument(st.Text(1), want_content && st.Int(2) != 0, st.Int(0));
    out.append(Project(doc, load_fields, true));
  }
  return out;
}

void SqliteIndex::Commit() {
  if (sqlite3_get_autocommit(db_->get()) == 0) db_->Exec("COMMIT");
  if (lost_writes_) {
    lost_writes_ = false;
    throw Error(kErrStorage,
                "Writes since the previous commit were lost to a storage failure; "
                "the later ones are committed");
  }
}

bool SqliteIndex::Merge(int pages) {
  // Never inside the client's open transaction; after its commit.
  if (sqlite3_get_autocommit(db_->get()) == 0) return false;
  if (!merge_pending_) return false;
  bool more = false;
  db_->Exec("BEGIN IMMEDIATE");
  try {
    for (const char* table : {"fts", "fts_name"}) {
      std::string t = table;
      int64_t before = sqlite3_total_changes64(db_->get());
      db_->Exec("INSERT INTO " + t + "(" + t + ", rank) VALUES ('merge', " + std::to_string(pages) +
                ")");
      // FTS5 counts two or more changes for a merge that did work.
      if (sqlite3_total_changes64(db_->get()) - before >= 2) more = true;
    }
    db_->Exec("COMMIT");
  } catch (...) {
    sqlite3_exec(db_->get(), "ROLLBACK", nullptr, nullptr, nullptr);
    throw;
  }
  merge_pending_ = more;
  return more;
}

int64_t SqliteIndex::CountDocuments() {
  Stmt& st = Cached("SELECT count(*) FROM docs");
  st.Step();
  int64_t n = st.Int(0);
  st.Reset();
  return n;
}

SearchResult SqliteIndex::Search(const SearchQuery& q) {
  // The full-text parts select candidate rows (all must hold): plain FTS5
  // expressions are ANDed into one MATCH; a term that may also match a file
  // name is a union of two row sets. The query is driven from these rows,
  // so a search reads only the rows that match, never the whole table.
  std::vector<std::string> fts_and;
  std::vector<std::pair<std::string, std::vector<Bound>>> sets;
  Where where;            // conditions on the candidate rows
  std::string rank_expr;  // OR of the full-text words, for scores and snippets
  auto add_rank = [&rank_expr](const std::string& e) {
    rank_expr += (rank_expr.empty() ? "(" : " OR (") + e + ")";
  };
  const std::string& pid = schema_.property_id();
  for (const QueryTerm& t : q.terms) {
    bool field_term = !t.field.empty() && (schema_.IsListed(t.field) || t.field == pid);
    if (!field_term) {
      QueryTerm whole = t;
      if (!t.field.empty()) whole.text = t.field + ":" + t.text;
      std::string expr = CatchAllExpr(whole);
      add_rank(expr);
      fts_and.push_back(expr);
      continue;
    }
    const FieldOptions& opts = schema_.Options(t.field);
    bool prefix = t.kind == QueryTerm::Kind::kPrefix;
    if (t.field == pid) {
      if (prefix) {
        where.Add("doc_id >= ? AND doc_id < ?", {t.text, PrefixUpperBound(t.text)});
      } else {
        where.Add("doc_id = ?", {t.text});
      }
    } else if (opts.analyzer == Analyzer::kKeyword) {
      fts_and.push_back("{kw} : " + FtsQuote(HexToken(t.field + ":" + t.text)) + Star(t));
    } else if (t.field == kContentField) {
      std::string expr = "{content} : " + FtsQuote(t.text) + Star(t);
      add_rank(expr);
      fts_and.push_back(expr);
    } else if (opts.type == FieldType::kInt || opts.type == FieldType::kDouble ||
               opts.type == FieldType::kBool) {
      Bound value;
      if (opts.type == FieldType::kBool) {
        if (t.text != "true" && t.text != "false") {
          throw Error(kErrBadQuery, "Field " + t.field + " takes true or false, not " + t.text);
        }
        value = static_cast<int64_t>(t.text == "true");
      } else {
        char* end = nullptr;
        double d = strtod(t.text.c_str(), &end);
        if (t.text.empty() || *end != '\0') {
          throw Error(kErrBadQuery, "Field " + t.field + " takes a number, not " + t.text);
        }
        value = d;
      }
      where.Add("json_extract(body, ?) = ?", {"$.\"" + t.field + "\"", value});
    } else {
      where.Add("instr(fold(json_extract(body, ?)), ?) > 0",
                {"$.\"" + t.field + "\"", FoldCase(t.text)});
    }
  }
  if (!q.name.empty()) {
    std::string folded = FoldCase(q.name);
    if (CodePointCount(folded) >= 3) {
      sets.push_back(
          {"SELECT rowid AS r FROM fts_name WHERE fts_name MATCH ?", {FtsQuote(folded)}});
    } else {
      // Too short for trigrams: a scan of the names.
      where.Add("instr(fold(name), ?) > 0", {folded});
    }
  }
  if (!q.path_prefix.empty()) {
    where.Add("doc_id >= ? AND doc_id < ?", {q.path_prefix, PrefixUpperBound(q.path_prefix)});
  }
  auto add_ext_set = [&where](const std::vector<std::string>& exts) {
    if (exts.empty()) return;
    std::string list;
    std::vector<Bound> binds;
    for (const std::string& e : exts) {
      list += list.empty() ? "?" : ", ?";
      binds.push_back(e);
    }
    where.Add("ext IN (" + list + ")", binds);
  };
  std::vector<std::string> category_exts;
  for (const std::string& c : q.categories) {
    std::vector<std::string> exts = CategoryExtensions(c);
    if (exts.empty()) throw Error(kErrBadQuery, "Unknown category " + c);
    category_exts.insert(category_exts.end(), exts.begin(), exts.end());
  }
  add_ext_set(category_exts);
  std::vector<std::string> exts;
  for (const std::string& e : q.extensions) exts.push_back(LowerAscii(e));
  add_ext_set(exts);
  if (q.size_min) where.Add("size >= ?", {*q.size_min});
  if (q.size_max) where.Add("size <= ?", {*q.size_max});
  if (q.modified_from) where.Add("mtime >= ?", {*q.modified_from});
  if (q.modified_to) where.Add("mtime <= ?", {*q.modified_to});

  // The candidate rows: one full-text query, narrowed by row sets that
  // must also hold. With words to rank by they carry their bm25 score.
  std::vector<Bound> cand_binds;
  std::string fts_all;
  for (const std::string& e : fts_and) fts_all += (fts_all.empty() ? "(" : " AND (") + e + ")";
  if (!fts_all.empty()) cand_binds.push_back(fts_all);
  for (auto& set : sets) cand_binds.insert(cand_binds.end(), set.second.begin(), set.second.end());
  auto candidates = [&](bool with_score) {
    std::string sql;
    if (!fts_all.empty()) {
      sql = std::string("SELECT rowid AS r") + (with_score ? ", bm25(fts) AS score" : "") +
            " FROM fts WHERE fts MATCH ?";
    }
    for (auto& set : sets) {
      sql = sql.empty() ? set.first : "SELECT * FROM (" + sql + ") WHERE r IN (" + set.first + ")";
    }
    return sql;
  };
  bool driven = !candidates(false).empty();
  bool row_checks = !where.sql.empty();
  // FROM: the candidates joined to their documents (CROSS JOIN keeps the
  // candidates as the outer loop), or all documents.
  auto from = [&](bool with_score) {
    if (!driven) return std::string("docs");
    return "(" + candidates(with_score) + ") AS c CROSS JOIN docs ON docs.rid = c.r";
  };

  SearchResult result;
  {
    // Without checks on the rows the matches are counted alone.
    std::string sql = driven && !row_checks
                          ? "SELECT count(*) FROM (" + candidates(false) + ")"
                          : "SELECT count(*) FROM " + from(false) + " WHERE 1" + where.sql;
    Stmt count(db_->get(), sql);
    BindAll(count, cand_binds, 1);
    BindAll(count, where.binds, static_cast<int>(cand_binds.size()) + 1);
    count.Step();
    result.total = count.Int(0);
  }
  if (result.total == 0 || q.limit <= 0) return result;

  // Ranking means scoring every match; beyond kMaxRankedMatches that costs
  // more than a search may take (and words that common weigh nothing in
  // bm25), so the newest documents come first instead.
  bool scored = !rank_expr.empty() && q.sort == SortKey::kRelevance;
  if (scored && result.total > kMaxRankedMatches) scored = false;
  result.ranked = scored;

  const char* dir = q.descending ? " DESC" : "";
  std::string order;
  switch (q.sort) {
    case SortKey::kRelevance:
      order = scored ? "score, r" : "r DESC";
      break;
    case SortKey::kName:
      order = std::string("name COLLATE NOCASE") + dir + ", r";
      break;
    case SortKey::kSize:
      order = std::string("size") + dir + ", r";
      break;
    case SortKey::kModified:
      order = std::string("mtime") + dir + ", r";
      break;
  }
  // Phase one: the page's row ids (from the full-text query alone when the
  // order needs nothing of the rows); phase two: their documents.
  std::string sql;
  if (driven && !row_checks && q.sort == SortKey::kRelevance) {
    sql = std::string("SELECT r, ") + (scored ? "score" : "NULL") + " FROM (" + candidates(scored) +
          ")";
  } else {
    sql = std::string("SELECT rid AS r, ") + (scored ? "score" : "NULL") + " FROM " + from(scored) +
          " WHERE 1" + where.sql;
  }
  sql += " ORDER BY " + order + " LIMIT ? OFFSET ?";
  std::vector<Bound> binds = cand_binds;
  binds.insert(binds.end(), where.binds.begin(), where.binds.end());
  binds.push_back(q.limit);
  binds.push_back(q.offset);
  std::vector<std::pair<int64_t, double>> page_rows;
  {
    Stmt page(db_->get(), sql);
    BindAll(page, binds, 1);
    while (page.Step()) page_rows.push_back({page.Int(0), page.IsNull(1) ? 0 : -page.Double(1)});
  }
  bool want_content = false;
  for (const std::string& f : q.fields) want_content = want_content || f == kContentField;
  for (const auto& [rid, score] : page_rows) {
    Stmt& row = Cached("SELECT doc_id, body, has_content FROM docs WHERE rid = ?");
    row.Bind(1, rid);
    if (!row.Step()) continue;
    SearchHit hit;
    hit.id = row.Text(0);
    std::string body = row.Text(1);
    bool has_content = row.Int(2) != 0;
    row.Reset();
    hit.score = score;
    hit.fields =
        Project(RowDocument(body, want_content && has_content, rid), q.fields, want_content);
    if (has_content) {
      if (!rank_expr.empty()) {
        Stmt& snip = Cached("SELECT snippet(fts, 1, ?, ?, '…', " + std::to_string(kSnippetTokens) +
                            ") FROM fts WHERE fts MATCH ? AND rowid = ?");
        snip.Bind(1, q.highlight_pre).Bind(2, q.highlight_post).Bind(3, rank_expr).Bind(4, rid);
        if (snip.Step()) hit.snippet = snip.Text(0);
        snip.Reset();
      }
      if (hit.snippet.empty()) {
        Stmt& text = Cached("SELECT substr(content, 1, ?) FROM fts WHERE rowid = ?");
        text.Bind(1, static_cast<int64_t>(kExcerptBytes)).Bind(2, rid);
        if (text.Step()) hit.snippet = Utf8Prefix(text.Text(0), kExcerptBytes);
        text.Reset();
      }
    }
    result.hits.push_back(std::move(hit));
  }
  return result;
}

void SqliteIndex::UpdateTermSuggestion(const std::string& doc_id) {
  std::optional<Stored> stored = Load(doc_id);
  if (!stored) throw Error(kErrDocumentNotFound, "No document " + doc_id);
  const Json::Value& doc = stored->doc;
  std::string text;
  std::string name = doc[kNameField].isString() ? doc[kNameField].asString() : Basename(doc_id);
  size_t dot = name.rfind('.');
  text = dot == std::string::npos || dot == 0 ? name : name.substr(0, dot);
  for (const char* field : kSuggestFields) text += " " + ValueText(doc[field]);
  std::set<std::string> terms;
  for (const std::string& w : Words(text)) {
    if (CodePointCount(w) >= 2) terms.insert(w);
  }
  Atomically([&] {
    Cached(
        "UPDATE suggest SET docs = docs - 1 WHERE term IN"
        " (SELECT term FROM suggest_doc WHERE doc_id = ?)")
        .Bind(1, doc_id)
        .Run();
    Cached("DELETE FROM suggest_doc WHERE doc_id = ?").Bind(1, doc_id).Run();
    for (const std::string& term : terms) {
      Cached("INSERT INTO suggest_doc(doc_id, term) VALUES (?, ?)")
          .Bind(1, doc_id)
          .Bind(2, term)
          .Run();
      Cached(
          "INSERT INTO suggest(term, docs) VALUES (?, 1)"
          " ON CONFLICT(term) DO UPDATE SET docs = docs + 1")
          .Bind(1, term)
          .Run();
    }
    Cached("DELETE FROM suggest WHERE docs <= 0").Run();
  });
}

std::vector<TermCount> SqliteIndex::SuggestTerms(const std::string& prefix, int64_t limit) {
  std::vector<TermCount> out;
  std::string folded = FoldCase(prefix);
  Stmt st(db_->get(),
          "SELECT term, docs FROM suggest WHERE term >= ? AND term < ?"
          " ORDER BY docs DESC, term LIMIT ?");
  st.Bind(1, folded).Bind(2, PrefixUpperBound(folded)).Bind(3, limit);
  while (st.Step()) out.push_back({st.Text(0), st.Int(1)});
  return out;
}

}  // namespace vellis::searchd
