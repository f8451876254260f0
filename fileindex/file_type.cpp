// File types by extension.
#include <cctype>
#include <string>

#include "fileindex/util.h"

namespace vellis::fileindex {

const std::vector<std::pair<const char*, FileType>>& FileExtensionPairs() {
  // Built on first use and never destroyed: classification may run at exit.
  static const auto* pairs = new std::vector<std::pair<const char*, FileType>>{
      // clang-format off
      // Documents: office files, text, source code, subtitles, archives, e-books, mail (646)
      {"", kDocument}, {"7", kDocument}, {"abap", kDocument}, {"as", kDocument}, {"ada", kDocument},
      {"s", kDocument}, {"ahk", kDocument}, {"bat", kDocument}, {"c", kDocument},
      {"cpp", kDocument}, {"clj", kDocument}, {"edn", kDocument}, {"cbl", kDocument},
      {"coffee", kDocument}, {"cfm", kDocument}, {"cs", kDocument}, {"css", kDocument},
      {"d", kDocument}, {"dart", kDocument}, {"diff", kDocument}, {"ejs", kDocument},
      {"erl", kDocument}, {"f", kDocument}, {"fth", kDocument}, {"forth", kDocument},
      {"ftl", kDocument}, {"glsl", kDocument}, {"go", kDocument}, {"groovy", kDocument},
      {"haml", kDocument}, {"handlebars", kDocument}, {"hs", kDocument}, {"hx", kDocument},
      {"ht3", kDocument}, {"htm", kDocument}, {"html", kDocument}, {"htmls", kDocument},
      {"ini", kDocument}, {"jack", kDocument}, {"jade", kDocument}, {"java", kDocument},
      {"js", kDocument}, {"json", kDocument}, {"jsp", kDocument}, {"jsx", kDocument},
      {"jl", kDocument}, {"latex", kDocument}, {"less", kDocument}, {"liquid", kDocument},
      {"lisp", kDocument}, {"ls", kDocument}, {"lsl", kDocument}, {"lua", kDocument},
      {"mk", kDocument}, {"markdown", kDocument}, {"m", kDocument}, {"mysql", kDocument},
      {"nix", kDocument}, {"ocaml", kDocument}, {"pascal", kDocument}, {"perl", kDocument},
      {"php", kDocument}, {"txt", kDocument}, {"pl", kDocument}, {"py", kDocument},
      {"r", kDocument}, {"rhtml", kDocument}, {"rb", kDocument}, {"rbw", kDocument},
      {"rs", kDocument}, {"sass", kDocument}, {"scad", kDocument}, {"scala", kDocument},
      {"scm", kDocument}, {"ss", kDocument}, {"scss", kDocument}, {"sh", kDocument},
      {"sjs", kDocument}, {"sql", kDocument}, {"styl", kDocument}, {"tcl", kDocument},
      {"tex", kDocument}, {"textile", kDocument}, {"vb", kDocument}, {"v", kDocument},
      {"vhdl", kDocument}, {"xml", kDocument}, {"xq", kDocument}, {"xqy", kDocument},
      {"xquery", kDocument}, {"yml", kDocument}, {"yaml", kDocument}, {"!!!", kDocument},
      {"$00", kDocument}, {"$01", kDocument}, {"$02", kDocument}, {"$04", kDocument},
      {"$05", kDocument}, {"$o1", kDocument}, {"$ol", kDocument}, {"1", kDocument},
      {"12da", kDocument}, {"1st", kDocument}, {"82t", kDocument}, {"92t", kDocument},
      {"abl", kDocument}, {"ac", kDocument}, {"adiumhtmllog", kDocument}, {"adiumlog", kDocument},
      {"adl", kDocument}, {"adt", kDocument}, {"adw", kDocument}, {"aiml", kDocument},
      {"alx", kDocument}, {"aml", kDocument}, {"android", kDocument}, {"annot", kDocument},
      {"ans", kDocument}, {"ansi", kDocument}, {"application", kDocument}, {"aprj", kDocument},
      {"apx", kDocument}, {"aqt", kDocument}, {"arff", kDocument}, {"artask", kDocument},
      {"asc", kDocument}, {"ascii", kDocument}, {"asl", kDocument}, {"asp", kDocument},
      {"ass", kDocument}, {"assoc", kDocument}, {"atc", kDocument}, {"att", kDocument},
      {"awa", kDocument}, {"awb", kDocument}, {"awd", kDocument}, {"awh", kDocument},
      {"awp", kDocument}, {"axt", kDocument}, {"ba1", kDocument}, {"bad", kDocument},
      {"bas", kDocument}, {"bbs", kDocument}, {"bbxt", kDocument}, {"bcr", kDocument},
      {"bdp", kDocument}, {"bdr", kDocument}, {"bea", kDocument}, {"bel", kDocument},
      {"bep", kDocument}, {"big", kDocument}, {"big5", kDocument}, {"bk", kDocument},
      {"blm", kDocument}, {"bln", kDocument}, {"blw", kDocument}, {"bmtp", kDocument},
      {"bna", kDocument}, {"bnx", kDocument}, {"bog", kDocument}, {"box", kDocument},
      {"bpdx", kDocument}, {"brf", kDocument}, {"bsdl", kDocument}, {"bss", kDocument},
      {"bt", kDocument}, {"bzw", kDocument}, {"cag", kDocument}, {"cas", kDocument},
      {"cascii", kDocument}, {"cc", kDocument}, {"cd2", kDocument}, {"charset", kDocument},
      {"cho", kDocument}, {"chord", kDocument}, {"cif", kDocument}, {"cil", kDocument},
      {"ckn", kDocument}, {"clg", kDocument}, {"cli", kDocument}, {"clix", kDocument},
      {"cmd", kDocument}, {"cmtx", kDocument}, {"cof", kDocument}, {"conf", kDocument},
      {"coo", kDocument}, {"crash", kDocument}, {"crd", kDocument}, {"csassembly", kDocument},
      {"csmanifest", kDocument}, {"csv", kDocument}, {"ctd", kDocument}, {"ctf", kDocument},
      {"ctl", kDocument}, {"ctx", kDocument}, {"dcd", kDocument}, {"dce", kDocument},
      {"ddd", kDocument}, {"ddt", kDocument}, {"de", kDocument}, {"dectest", kDocument},
      {"des", kDocument}, {"desc", kDocument}, {"dfe", kDocument}, {"dfm", kDocument},
      {"dii", kDocument}, {"diskdefines", kDocument}, {"diz", kDocument}, {"dk", kDocument},
      {"dkz", kDocument}, {"dmr", kDocument}, {"dne", kDocument}, {"dok", kDocument},
      {"dp", kDocument}, {"dpv", kDocument}, {"dqy", kDocument}, {"drp", kDocument},
      {"dsc", kDocument}, {"dsml", kDocument}, {"dtd", kDocument}, {"dwl", kDocument},
      {"ecsv", kDocument}, {"edml", kDocument}, {"edt", kDocument}, {"efm", kDocument},
      {"eia", kDocument}, {"emulecollection", kDocument}, {"en", kDocument}, {"enc", kDocument},
      {"enf", kDocument}, {"eng", kDocument}, {"err", kDocument}, {"es", kDocument},
      {"esw", kDocument}, {"etf", kDocument}, {"etx", kDocument}, {"euc", kDocument},
      {"ext", kDocument}, {"extra", kDocument}, {"faq", kDocument}, {"fff", kDocument},
      {"ffp", kDocument}, {"fin", kDocument}, {"first", kDocument}, {"flr", kDocument},
      {"fmr", kDocument}, {"fnx", kDocument}, {"fon", kDocument}, {"fr", kDocument},
      {"fra", kDocument}, {"frm", kDocument}, {"fsa", kDocument}, {"full", kDocument},
      {"gbf", kDocument}, {"gdt", kDocument}, {"gen", kDocument}, {"ger", kDocument},
      {"gnu", kDocument}, {"gpl", kDocument}, {"gs", kDocument}, {"gthr", kDocument},
      {"gtx", kDocument}, {"guide", kDocument}, {"hdr", kDocument}, {"hhc", kDocument},
      {"hhs", kDocument}, {"hlm", kDocument}, {"hlx", kDocument}, {"hp8", kDocument},
      {"hsk", kDocument}, {"htx", kDocument}, {"hvc", kDocument}, {"hwl", kDocument},
      {"hz", kDocument}, {"id31", kDocument}, {"id32", kDocument}, {"idc", kDocument},
      {"idt", kDocument}, {"idx", kDocument}, {"iem", kDocument}, {"igv", kDocument},
      {"igy", kDocument}, {"iif", kDocument}, {"inc", kDocument}, {"inuse", kDocument},
      {"ion", kDocument}, {"ipr", kDocument}, {"iqy", kDocument}, {"isr", kDocument},
      {"it", kDocument}, {"ivp", kDocument}, {"ja", kDocument}, {"jad", kDocument},
      {"jam", kDocument}, {"jeb", kDocument}, {"jis", kDocument}, {"jp1", kDocument},
      {"jss", kDocument}, {"jtx", kDocument}, {"kahl", kDocument}, {"kar", kDocument},
      {"kch", kDocument}, {"kix", kDocument}, {"klg", kDocument}, {"kor", kDocument},
      {"la", kDocument}, {"label", kDocument}, {"las", kDocument}, {"lay", kDocument},
      {"lin", kDocument}, {"linux", kDocument}, {"linx", kDocument}, {"lnc", kDocument},
      {"log", kDocument}, {"lo_", kDocument}, {"lrc", kDocument}, {"lst", kDocument},
      {"ltr", kDocument}, {"ltt", kDocument}, {"ltx", kDocument}, {"lue", kDocument},
      {"luf", kDocument}, {"lwd", kDocument}, {"lxfml", kDocument}, {"lyr", kDocument},
      {"lyt", kDocument}, {"man", kDocument}, {"manifest", kDocument}, {"map", kDocument},
      {"mar", kDocument}, {"mathml", kDocument}, {"maxfr", kDocument}, {"mcw", kDocument},
      {"md", kDocument}, {"mdl", kDocument}, {"mdle", kDocument}, {"mdown", kDocument},
      {"mdtext", kDocument}, {"mdtxt", kDocument}, {"mdwn", kDocument}, {"me", kDocument},
      {"mez", kDocument}, {"mf", kDocument}, {"mib", kDocument}, {"mit", kDocument},
      {"mkd", kDocument}, {"mkdn", kDocument}, {"mno", kDocument}, {"mnu", kDocument},
      {"modd", kDocument}, {"mpsub", kDocument}, {"mss", kDocument}, {"mtx", kDocument},
      {"mtxt", kDocument}, {"mvg", kDocument}, {"mw", kDocument}, {"nbr", kDocument},
      {"nclk", kDocument}, {"ncm", kDocument}, {"new", kDocument}, {"nfo", kDocument},
      {"nlc", kDocument}, {"nmbd", kDocument}, {"nokogiri", kDocument}, {"not", kDocument},
      {"notes", kDocument}, {"now", kDocument}, {"npdt", kDocument}, {"nt", kDocument},
      {"nwctxt", kDocument}, {"ocr", kDocument}, {"oh", kDocument}, {"ojp", kDocument},
      {"omn", kDocument}, {"oogl", kDocument}, {"oot", kDocument}, {"opc", kDocument},
      {"openbsd", kDocument}, {"opml", kDocument}, {"ort", kDocument}, {"osi", kDocument},
      {"p3x", kDocument}, {"panic", kDocument}, {"pbd", kDocument}, {"pc5", kDocument},
      {"pcl", kDocument}, {"pd", kDocument}, {"pdu", kDocument}, {"pfs", kDocument},
      {"pgw", kDocument}, {"pjs", kDocument}, {"pla", kDocument}, {"plf", kDocument},
      {"plg", kDocument}, {"plist", kDocument}, {"plk", kDocument}, {"pln", kDocument},
      {"pml", kDocument}, {"pmo", kDocument}, {"pod", kDocument}, {"prc", kDocument},
      {"prn", kDocument}, {"pro", kDocument}, {"prr", kDocument}, {"ps", kDocument},
      {"psb", kDocument}, {"psi2", kDocument}, {"pt3", kDocument}, {"pts", kDocument},
      {"pvj", kDocument}, {"pvw", kDocument}, {"q&a", kDocument}, {"qdt", kDocument},
      {"qud", kDocument}, {"rbdf", kDocument}, {"rdf", kDocument}, {"rea", kDocument},
      {"readme", kDocument}, {"reg", kDocument}, {"rel", kDocument}, {"rep", kDocument},
      {"resp", kDocument}, {"rest", kDocument}, {"rff", kDocument}, {"ris", kDocument},
      {"rml", kDocument}, {"rqy", kDocument}, {"rst", kDocument}, {"rt", kDocument},
      {"rtl", kDocument}, {"rtx", kDocument}, {"ru", kDocument}, {"rus", kDocument},
      {"rzk", kDocument}, {"rzn", kDocument}, {"s19", kDocument}, {"s2k", kDocument},
      {"sami", kDocument}, {"sbv", kDocument}, {"sct", kDocument}, {"sdnf", kDocument},
      {"sen", kDocument}, {"seq", kDocument}, {"set", kDocument}, {"sfb", kDocument},
      {"sgp", kDocument}, {"sha1", kDocument}, {"sha512", kDocument}, {"skcard", kDocument},
      {"skv", kDocument}, {"sls", kDocument}, {"smali", kDocument}, {"smf", kDocument},
      {"smi", kDocument}, {"sms", kDocument}, {"snw", kDocument}, {"soap", kDocument},
      {"soundscript", kDocument}, {"spa", kDocument}, {"spec", kDocument}, {"spg", kDocument},
      {"spn", kDocument}, {"spx", kDocument}, {"srt", kDocument}, {"srx", kDocument},
      {"ssa", kDocument}, {"ssf", kDocument}, {"st1", kDocument}, {"stf", kDocument},
      {"stq", kDocument}, {"strings", kDocument}, {"sub", kDocument}, {"syn", kDocument},
      {"t", kDocument}, {"t2t", kDocument}, {"tab", kDocument}, {"tbd", kDocument},
      {"tbl", kDocument}, {"tbx", kDocument}, {"tce", kDocument}, {"tcm", kDocument},
      {"tdf", kDocument}, {"ted", kDocument}, {"text", kDocument}, {"textclipping", kDocument},
      {"tfw", kDocument}, {"tgf", kDocument}, {"thml", kDocument}, {"thp", kDocument},
      {"tlb", kDocument}, {"tle", kDocument}, {"tlx", kDocument}, {"tm", kDocument},
      {"tml", kDocument}, {"tmprtf", kDocument}, {"tmx", kDocument}, {"tnef", kDocument},
      {"tph", kDocument}, {"tpl", kDocument}, {"trn", kDocument}, {"trt", kDocument},
      {"tsv", kDocument}, {"tt", kDocument}, {"ttbl", kDocument}, {"tte", kDocument},
      {"ttpl", kDocument}, {"ttxt", kDocument}, {"tx8", kDocument}, {"tx?", kDocument},
      {"txa", kDocument}, {"txd", kDocument}, {"txe", kDocument}, {"txh", kDocument},
      {"u3i", kDocument}, {"uax", kDocument}, {"uhtml", kDocument}, {"uk", kDocument},
      {"unauth", kDocument}, {"uni", kDocument}, {"unx", kDocument}, {"us", kDocument},
      {"usa", kDocument}, {"user", kDocument}, {"usf", kDocument}, {"usg", kDocument},
      {"utf8", kDocument}, {"utx", kDocument}, {"utxt", kDocument}, {"ver", kDocument},
      {"vet", kDocument}, {"vfk", kDocument}, {"vhd", kDocument}, {"vis", kDocument},
      {"vkp", kDocument}, {"vmg", kDocument}, {"vmsg", kDocument}, {"vna", kDocument},
      {"vsmproj", kDocument}, {"vw", kDocument}, {"vw3", kDocument}, {"vxml", kDocument},
      {"wer", kDocument}, {"wir", kDocument}, {"wkf", kDocument}, {"wn", kDocument},
      {"wrd", kDocument}, {"wrl", kDocument}, {"wsc", kDocument}, {"wst", kDocument},
      {"wtf", kDocument}, {"wtl", kDocument}, {"wtx", kDocument}, {"x20", kDocument},
      {"x60", kDocument}, {"x70", kDocument}, {"x80", kDocument}, {"x90", kDocument},
      {"xb0", kDocument}, {"xc0", kDocument}, {"xct", kDocument}, {"xd0", kDocument},
      {"xdl", kDocument}, {"xdp", kDocument}, {"xfd", kDocument}, {"xff", kDocument},
      {"xhtm", kDocument}, {"xlf", kDocument}, {"xsd", kDocument}, {"xsl", kDocument},
      {"xslt", kDocument}, {"xsr", kDocument}, {"xwp", kDocument}, {"xy", kDocument},
      {"xy3", kDocument}, {"xyp", kDocument}, {"xyw", kDocument}, {"xyz", kDocument},
      {"zanebug", kDocument}, {"zed", kDocument}, {"zhp", kDocument}, {"zib", kDocument},
      {"zw", kDocument}, {"zxe", kDocument}, {"_me", kDocument}, {"xls", kDocument},
      {"xlt", kDocument}, {"slk", kDocument}, {"gnumeric", kDocument}, {"docx", kDocument},
      {"dotx", kDocument}, {"docm", kDocument}, {"dotm", kDocument}, {"pptx", kDocument},
      {"ppsx", kDocument}, {"potx", kDocument}, {"pptm", kDocument}, {"ppsm", kDocument},
      {"potm", kDocument}, {"xlsx", kDocument}, {"xltx", kDocument}, {"xlsm", kDocument},
      {"xltm", kDocument}, {"odt", kDocument}, {"ods", kDocument}, {"odp", kDocument},
      {"odg", kDocument}, {"odc", kDocument}, {"odf", kDocument}, {"odb", kDocument},
      {"odi", kDocument}, {"odm", kDocument}, {"ott", kDocument}, {"ots", kDocument},
      {"otp", kDocument}, {"otg", kDocument}, {"otc", kDocument}, {"otf", kDocument},
      {"oti", kDocument}, {"oth", kDocument}, {"pages", kDocument}, {"key", kDocument},
      {"numbers", kDocument}, {"doc", kDocument}, {"dot", kDocument}, {"ppt", kDocument},
      {"pps", kDocument}, {"pot", kDocument}, {"ppa", kDocument}, {"rtf", kDocument},
      {"pdf", kDocument}, {"7z", kDocument}, {"bz2", kDocument}, {"gz", kDocument},
      {"zip", kDocument}, {"tgz", kDocument}, {"tbz", kDocument}, {"tar", kDocument},
      {"rar", kDocument}, {"epub", kDocument}, {"eml", kDocument}, {"msg", kDocument},
      {"chm", kDocument}, {"mobi", kDocument}, {"azw3", kDocument}, {"pdb", kDocument},
      {"lit", kDocument},
      // Audio (25)
      {"mp3", kAudio}, {"mp1", kAudio}, {"mp2", kAudio}, {"mpa", kAudio}, {"wma", kAudio},
      {"wav", kAudio}, {"ogg", kAudio}, {"m4a", kAudio}, {"aac", kAudio}, {"ac3", kAudio},
      {"ram", kAudio}, {"ra", kAudio}, {"m4p", kAudio}, {"flac", kAudio}, {"aiff", kAudio},
      {"aif", kAudio}, {"pcm", kAudio}, {"m4b", kAudio}, {"ape", kAudio}, {"dsf", kAudio},
      {"dff", kAudio}, {"m3u", kAudio}, {"wpl", kAudio}, {"pls", kAudio}, {"cue", kAudio},
      // Video (31)
      {"mpg", kVideo}, {"mpeg", kVideo}, {"avi", kVideo}, {"asf", kVideo}, {"wmv", kVideo},
      {"mov", kVideo}, {"flv", kVideo}, {"f4v", kVideo}, {"dat", kVideo}, {"rm", kVideo},
      {"rmvb", kVideo}, {"mp4", kVideo}, {"divx", kVideo}, {"xvid", kVideo}, {"vob", kVideo},
      {"mkv", kVideo}, {"ts", kVideo}, {"m2ts", kVideo}, {"m2t", kVideo}, {"mts", kVideo},
      {"m4v", kVideo}, {"3gp", kVideo}, {"3g2", kVideo}, {"qt", kVideo}, {"swf", kVideo},
      {"dvr-ms", kVideo}, {"vdr", kVideo}, {"iso", kVideo}, {"ifo", kVideo}, {"trp", kVideo},
      {"tp", kVideo},
      // Images (33)
      {"jpg", kImage}, {"jpeg", kImage}, {"jpe", kImage}, {"bmp", kImage}, {"png", kImage},
      {"gif", kImage}, {"ico", kImage}, {"tif", kImage}, {"tiff", kImage}, {"psd", kImage},
      {"ufo", kImage}, {"arw", kImage}, {"srf", kImage}, {"sr2", kImage}, {"dcr", kImage},
      {"k25", kImage}, {"kdc", kImage}, {"cr2", kImage}, {"crw", kImage}, {"nef", kImage},
      {"mrw", kImage}, {"ptx", kImage}, {"pef", kImage}, {"raf", kImage}, {"3fr", kImage},
      {"erf", kImage}, {"mef", kImage}, {"mos", kImage}, {"orf", kImage}, {"rw2", kImage},
      {"dng", kImage}, {"x3f", kImage}, {"raw", kImage},
      // clang-format on
  };
  return *pairs;
}

std::map<std::string, FileType> BuildExtensionTable(
    const std::vector<std::pair<const char*, FileType>>& pairs) {
  std::map<std::string, FileType> table;
  // emplace keeps the entry already there: the first pair of an extension wins.
  for (const auto& pair : pairs) table.emplace(pair.first, pair.second);
  return table;
}

const std::map<std::string, FileType>& FileExtensionTable() {
  static const auto* table =
      new std::map<std::string, FileType>(BuildExtensionTable(FileExtensionPairs()));
  return *table;
}

FileType GetFileTypeByFullPath(const std::string& full_path) {
  const std::map<std::string, FileType>& table = FileExtensionTable();
  auto it = table.find(GetFileExtension(full_path, true));
  return it == table.end() ? kUnknownFileType : it->second;
}

const CategoryQuery kCategoryQueries[4] = {
    {"document",
     "docx OR wri OR rtf OR xla OR xlb OR xlc OR xld OR xlk OR xll OR xlm OR xlt OR "
     "xlv OR xlw OR xlsx OR xlsm OR xlsb OR xltm OR xlam OR pptx OR pps OR ppsx OR "
     "pdf OR txt OR doc OR xls OR ppt OR odt OR ods OR odp OR odg OR odc OR odf OR "
     "odb OR odi OR odm OR ott OR ots OR otp OR otg OR otc OR otf OR oti OR oth OR "
     "potx OR pptm OR ppsm OR potm OR dotx OR dot OR pot OR ppa OR xltx OR docm OR "
     "dotm OR eml OR msgc OR c OR cc OR cpp OR cs OR cxx OR ada OR coffee OR cs OR "
     "css OR js OR json OR lisp OR markdown OR ocaml OR pl OR py OR rb OR sass OR "
     "scala OR r OR tex OR conf OR csv OR sub OR srt OR md OR log OR mobi OR azw3 OR "
     "pdb OR epub OR chm OR lit"},
    {"audio",
     "aac OR ac3 OR aif OR aiff OR ape OR cue OR dff OR dsf OR flac OR m3u OR m4a OR "
     "m4b OR m4p OR mp1 OR mp2 OR mp3 OR mpa OR ogg OR pcm OR pls OR ra OR ram OR "
     "wav OR wma OR wpl"},
    {"video",
     "3g2 OR 3gp OR asf OR avi OR dat OR divx OR dvr-ms OR f4v OR flv OR ifo OR iso "
     "OR m2t OR m2ts OR m4v OR mkv OR mov OR mp4 OR mpeg OR mpg OR mts OR qt OR rm "
     "OR rmvb OR swf OR tp OR trp OR ts OR vdr OR vob OR wmv OR xvid"},
    {"image",
     "3fr OR arw OR bmp OR cr2 OR crw OR dcr OR dng OR erf OR gif OR ico OR jpe OR "
     "jpeg OR jpg OR k25 OR kdc OR mef OR mos OR mrw OR nef OR orf OR pef OR png OR "
     "psd OR ptx OR raf OR raw OR rw2 OR sr2 OR srf OR tif OR tiff OR ufo OR x3f"},
};

std::string GetCategoryQuery(const std::string& category) {
  for (const CategoryQuery& row : kCategoryQueries) {
    if (category == row.category) return row.query;
  }
  return "";
}

}  // namespace vellis::fileindex
