#include "fileindex/file_types.h"

#include <iterator>
#include <utility>

namespace quivra::fileindex {
namespace {

// clang-format off
/// The empty extension counts: a file without one is a document. "prc" stands here twice.
constexpr std::string_view kDocumentExtensions[] = {
    "", "7", "abap", "as", "ada", "s", "ahk", "bat", "c", "cpp", "clj", "edn", "cbl", "coffee",
    "cfm", "cs", "css", "d", "dart", "diff", "ejs", "erl", "f", "fth", "forth", "ftl", "glsl",
    "go", "groovy", "haml", "handlebars", "hs", "hx", "ht3", "htm", "html", "htmls", "ini",
    "jack", "jade", "java", "js", "json", "jsp", "jsx", "jl", "latex", "less", "liquid", "lisp",
    "ls", "lsl", "lua", "mk", "markdown", "m", "mysql", "nix", "ocaml", "pascal", "perl", "php",
    "txt", "pl", "py", "r", "rhtml", "rb", "rbw", "rs", "sass", "scad", "scala", "scm", "ss",
    "scss", "sh", "sjs", "sql", "styl", "tcl", "tex", "textile", "vb", "v", "vhdl", "xml", "xq",
    "xqy", "xquery", "yml", "yaml", "!!!", "$00", "$01", "$02", "$04", "$05", "$o1", "$ol", "1",
    "12da", "1st", "82t", "92t", "abl", "ac", "adiumhtmllog", "adiumlog", "adl", "adt", "adw",
    "aiml", "alx", "aml", "android", "annot", "ans", "ansi", "application", "aprj", "apx",
    "aqt", "arff", "artask", "asc", "ascii", "asl", "asp", "ass", "assoc", "atc", "att", "awa",
    "awb", "awd", "awh", "awp", "axt", "ba1", "bad", "bas", "bbs", "bbxt", "bcr", "bdp", "bdr",
    "bea", "bel", "bep", "big", "big5", "bk", "blm", "bln", "blw", "bmtp", "bna", "bnx", "bog",
    "box", "bpdx", "brf", "bsdl", "bss", "bt", "bzw", "cag", "cas", "cascii", "cc", "cd2",
    "charset", "cho", "chord", "cif", "cil", "ckn", "clg", "cli", "clix", "cmd", "cmtx", "cof",
    "conf", "coo", "crash", "crd", "csassembly", "csmanifest", "csv", "ctd", "ctf", "ctl",
    "ctx", "dcd", "dce", "ddd", "ddt", "de", "dectest", "des", "desc", "dfe", "dfm", "dii",
    "diskdefines", "diz", "dk", "dkz", "dmr", "dne", "dok", "dp", "dpv", "dqy", "drp", "dsc",
    "dsml", "dtd", "dwl", "ecsv", "edml", "edt", "efm", "eia", "emulecollection", "en", "enc",
    "enf", "eng", "err", "es", "esw", "etf", "etx", "euc", "ext", "extra", "faq", "fff", "ffp",
    "fin", "first", "flr", "fmr", "fnx", "fon", "fr", "fra", "frm", "fsa", "full", "gbf", "gdt",
    "gen", "ger", "gnu", "gpl", "gs", "gthr", "gtx", "guide", "hdr", "hhc", "hhs", "hlm", "hlx",
    "hp8", "hsk", "htx", "hvc", "hwl", "hz", "id31", "id32", "idc", "idt", "idx", "iem", "igv",
    "igy", "iif", "inc", "inuse", "ion", "ipr", "iqy", "isr", "it", "ivp", "ja", "jad", "jam",
    "jeb", "jis", "jp1", "jss", "jtx", "kahl", "kar", "kch", "kix", "klg", "kor", "la", "label",
    "las", "lay", "lin", "linux", "linx", "lnc", "log", "lo_", "lrc", "lst", "ltr", "ltt",
    "ltx", "lue", "luf", "lwd", "lxfml", "lyr", "lyt", "man", "manifest", "map", "mar",
    "mathml", "maxfr", "mcw", "md", "mdl", "mdle", "mdown", "mdtext", "mdtxt", "mdwn", "me",
    "mez", "mf", "mib", "mit", "mkd", "mkdn", "mno", "mnu", "modd", "mpsub", "mss", "mtx",
    "mtxt", "mvg", "mw", "nbr", "nclk", "ncm", "new", "nfo", "nlc", "nmbd", "nokogiri", "not",
    "notes", "now", "npdt", "nt", "nwctxt", "ocr", "oh", "ojp", "omn", "oogl", "oot", "opc",
    "openbsd", "opml", "ort", "osi", "p3x", "panic", "pbd", "pc5", "pcl", "pd", "pdu", "pfs",
    "pgw", "pjs", "pla", "plf", "plg", "plist", "plk", "pln", "pml", "pmo", "pod", "prc", "prn",
    "pro", "prr", "ps", "psb", "psi2", "pt3", "pts", "pvj", "pvw", "q&a", "qdt", "qud", "rbdf",
    "rdf", "rea", "readme", "reg", "rel", "rep", "resp", "rest", "rff", "ris", "rml", "rqy",
    "rst", "rt", "rtl", "rtx", "ru", "rus", "rzk", "rzn", "s19", "s2k", "sami", "sbv", "sct",
    "sdnf", "sen", "seq", "set", "sfb", "sgp", "sha1", "sha512", "skcard", "skv", "sls",
    "smali", "smf", "smi", "sms", "snw", "soap", "soundscript", "spa", "spec", "spg", "spn",
    "spx", "srt", "srx", "ssa", "ssf", "st1", "stf", "stq", "strings", "sub", "syn", "t", "t2t",
    "tab", "tbd", "tbl", "tbx", "tce", "tcm", "tdf", "ted", "text", "textclipping", "tfw",
    "tgf", "thml", "thp", "tlb", "tle", "tlx", "tm", "tml", "tmprtf", "tmx", "tnef", "tph",
    "tpl", "trn", "trt", "tsv", "tt", "ttbl", "tte", "ttpl", "ttxt", "tx8", "tx?", "txa", "txd",
    "txe", "txh", "u3i", "uax", "uhtml", "uk", "unauth", "uni", "unx", "us", "usa", "user",
    "usf", "usg", "utf8", "utx", "utxt", "ver", "vet", "vfk", "vhd", "vis", "vkp", "vmg",
    "vmsg", "vna", "vsmproj", "vw", "vw3", "vxml", "wer", "wir", "wkf", "wn", "wrd", "wrl",
    "wsc", "wst", "wtf", "wtl", "wtx", "x20", "x60", "x70", "x80", "x90", "xb0", "xc0", "xct",
    "xd0", "xdl", "xdp", "xfd", "xff", "xhtm", "xlf", "xsd", "xsl", "xslt", "xsr", "xwp", "xy",
    "xy3", "xyp", "xyw", "xyz", "zanebug", "zed", "zhp", "zib", "zw", "zxe", "_me", "xls",
    "xlt", "slk", "gnumeric", "docx", "dotx", "docm", "dotm", "pptx", "ppsx", "potx", "pptm",
    "ppsm", "potm", "xlsx", "xltx", "xlsm", "xltm", "odt", "ods", "odp", "odg", "odc", "odf",
    "odb", "odi", "odm", "ott", "ots", "otp", "otg", "otc", "otf", "oti", "oth", "pages", "key",
    "numbers", "doc", "dot", "ppt", "pps", "pot", "ppa", "rtf", "pdf", "7z", "bz2", "gz", "zip",
    "tgz", "tbz", "tar", "rar", "epub", "eml", "msg", "chm", "mobi", "azw3", "pdb", "prc", "lit"};
static_assert(std::size(kDocumentExtensions) == 647);

constexpr std::string_view kAudioExtensions[] = {
    "mp3", "mp1", "mp2", "mpa", "wma", "wav", "ogg", "m4a", "aac", "ac3", "ram", "ra", "m4p",
    "flac", "aiff", "aif", "pcm", "m4b", "ape", "dsf", "dff", "m3u", "wpl", "pls", "cue"};
static_assert(std::size(kAudioExtensions) == 25);

constexpr std::string_view kVideoExtensions[] = {
    "mpg", "mpeg", "avi", "asf", "wmv", "mov", "flv", "f4v", "dat", "rm", "rmvb", "mp4", "divx",
    "xvid", "vob", "mkv", "ts", "m2ts", "m2t", "mts", "m4v", "3gp", "3g2", "qt", "swf",
    "dvr-ms", "vdr", "iso", "ifo", "trp", "tp"};
static_assert(std::size(kVideoExtensions) == 31);

constexpr std::string_view kImageExtensions[] = {
    "jpg", "jpeg", "jpe", "bmp", "png", "gif", "ico", "tif", "tiff", "psd", "ufo", "arw", "srf",
    "sr2", "dcr", "k25", "kdc", "cr2", "crw", "nef", "mrw", "ptx", "pef", "raf", "3fr", "erf",
    "mef", "mos", "orf", "rw2", "dng", "x3f", "raw"};
static_assert(std::size(kImageExtensions) == 33);

/// One category's query, "EXTENSION OR EXTENSION OR ...". The lists are not those above, and "msgc"
/// and the repeated "cs" belong to them: indexes were filled and searched with exactly these texts.
constexpr std::pair<const char*, const char*> kCategoryQueries[] = {
    {"document",
     "docx OR wri OR rtf OR xla OR xlb OR xlc OR xld OR xlk OR xll OR xlm OR xlt OR xlv OR xlw "
     "OR xlsx OR xlsm OR xlsb OR xltm OR xlam OR pptx OR pps OR ppsx OR pdf OR txt OR doc OR "
     "xls OR ppt OR odt OR ods OR odp OR odg OR odc OR odf OR odb OR odi OR odm OR ott OR ots "
     "OR otp OR otg OR otc OR otf OR oti OR oth OR potx OR pptm OR ppsm OR potm OR dotx OR dot "
     "OR pot OR ppa OR xltx OR docm OR dotm OR eml OR msgc OR c OR cc OR cpp OR cs OR cxx OR "
     "ada OR coffee OR cs OR css OR js OR json OR lisp OR markdown OR ocaml OR pl OR py OR rb "
     "OR sass OR scala OR r OR tex OR conf OR csv OR sub OR srt OR md OR log OR mobi OR azw3 "
     "OR pdb OR epub OR chm OR lit"},
    {"audio",
     "aac OR ac3 OR aif OR aiff OR ape OR cue OR dff OR dsf OR flac OR m3u OR m4a OR m4b OR "
     "m4p OR mp1 OR mp2 OR mp3 OR mpa OR ogg OR pcm OR pls OR ra OR ram OR wav OR wma OR wpl"},
    {"video",
     "3g2 OR 3gp OR asf OR avi OR dat OR divx OR dvr-ms OR f4v OR flv OR ifo OR iso OR m2t OR "
     "m2ts OR m4v OR mkv OR mov OR mp4 OR mpeg OR mpg OR mts OR qt OR rm OR rmvb OR swf OR tp "
     "OR trp OR ts OR vdr OR vob OR wmv OR xvid"},
    {"image",
     "3fr OR arw OR bmp OR cr2 OR crw OR dcr OR dng OR erf OR gif OR ico OR jpe OR jpeg OR jpg "
     "OR k25 OR kdc OR mef OR mos OR mrw OR nef OR orf OR pef OR png OR psd OR ptx OR raf OR "
     "raw OR rw2 OR sr2 OR srf OR tif OR tiff OR ufo OR x3f"}};
// clang-format on

static_assert(std::size(kDocumentExtensions) + std::size(kAudioExtensions) +
                  std::size(kVideoExtensions) + std::size(kImageExtensions) ==
              736);

template <std::size_t kCount>
void AddTypes(std::map<std::string_view, FileType>& types,
              const std::string_view (&extensions)[kCount], FileType type) {
    for (const std::string_view extension : extensions) {
        types.emplace(extension, type);  // of an extension listed twice the first counts
    }
}

std::map<std::string_view, FileType> MakeFileTypes() {
    std::map<std::string_view, FileType> types;
    AddTypes(types, kDocumentExtensions, FileType::kDocument);
    AddTypes(types, kAudioExtensions, FileType::kAudio);
    AddTypes(types, kVideoExtensions, FileType::kVideo);
    AddTypes(types, kImageExtensions, FileType::kImage);
    return types;
}

const std::map<std::string_view, FileType> file_types = MakeFileTypes();

}  // namespace

const std::map<std::string_view, FileType>& GetFileTypes() {
    return file_types;
}

std::string GetCategoryQuery(const std::string& category) {
    for (const auto& [name, query] : kCategoryQueries) {
        if (category == name) {
            return query;
        }
    }
    return std::string();
}

}  // namespace quivra::fileindex
