// File types by extension.
#define QUARROX_LOG_UNIT "util"

#include <algorithm>
#include <array>
#include <string>
#include <string_view>

#include "common/strings.h"
#include "fileindex/util.h"

namespace quarrox::fileindex {
namespace {

// The extensions of each type, one blank between two. Odd ones ("!!!", "tx?", "q&a") are extensions exactly as written.
constexpr std::string_view kDocuments =
    "7 abap as ada s ahk bat c cpp clj edn cbl coffee cfm cs css d dart diff ejs erl f fth forth ftl glsl go "
    "groovy haml handlebars hs hx ht3 htm html htmls ini jack jade java js json jsp jsx jl latex less liquid lisp "
    "ls lsl lua mk markdown m mysql nix ocaml pascal perl php txt pl py r rhtml rb rbw rs sass scad scala scm ss "
    "scss sh sjs sql styl tcl tex textile vb v vhdl xml xq xqy xquery yml yaml !!! $00 $01 $02 $04 $05 $o1 $ol 1 "
    "12da 1st 82t 92t abl ac adiumhtmllog adiumlog adl adt adw aiml alx aml android annot ans ansi application "
    "aprj apx aqt arff artask asc ascii asl asp ass assoc atc att awa awb awd awh awp axt ba1 bad bas bbs bbxt "
    "bcr bdp bdr bea bel bep big big5 bk blm bln blw bmtp bna bnx bog box bpdx brf bsdl bss bt bzw cag cas cascii "
    "cc cd2 charset cho chord cif cil ckn clg cli clix cmd cmtx cof conf coo crash crd csassembly csmanifest csv "
    "ctd ctf ctl ctx dcd dce ddd ddt de dectest des desc dfe dfm dii diskdefines diz dk dkz dmr dne dok dp dpv "
    "dqy drp dsc dsml dtd dwl ecsv edml edt efm eia emulecollection en enc enf eng err es esw etf etx euc ext "
    "extra faq fff ffp fin first flr fmr fnx fon fr fra frm fsa full gbf gdt gen ger gnu gpl gs gthr gtx guide "
    "hdr hhc hhs hlm hlx hp8 hsk htx hvc hwl hz id31 id32 idc idt idx iem igv igy iif inc inuse ion ipr iqy isr "
    "it ivp ja jad jam jeb jis jp1 jss jtx kahl kar kch kix klg kor la label las lay lin linux linx lnc log lo_ "
    "lrc lst ltr ltt ltx lue luf lwd lxfml lyr lyt man manifest map mar mathml maxfr mcw md mdl mdle mdown mdtext "
    "mdtxt mdwn me mez mf mib mit mkd mkdn mno mnu modd mpsub mss mtx mtxt mvg mw nbr nclk ncm new nfo nlc nmbd "
    "nokogiri not notes now npdt nt nwctxt ocr odoc oh ojp omn oogl oot opc openbsd opml ort osheet osi oslides "
    "p3x panic pbd pc5 pcl pd pdu pfs pgw pjs pla plf plg plist plk pln pml pmo pod prc prn pro prr ps psb psi2 "
    "pt3 pts pvj pvw q&a qdt qud rbdf rdf rea readme reg rel rep resp rest rff ris rml rqy rst rt rtl rtx ru rus "
    "rzk rzn s19 s2k sami sbv sct sdnf sen seq set sfb sgp sha1 sha512 skcard skv sls smali smf smi sms snw soap "
    "soundscript spa spec spg spn spx srt srx ssa ssf st1 stf stq strings sub syn t t2t tab tbd tbl tbx tce tcm "
    "tdf ted text textclipping tfw tgf thml thp tlb tle tlx tm tml tmprtf tmx tnef tph tpl trn trt tsv tt ttbl "
    "tte ttpl ttxt tx8 tx? txa txd txe txh u3i uax uhtml uk unauth uni unx us usa user usf usg utf8 utx utxt ver "
    "vet vfk vhd vis vkp vmg vmsg vna vsmproj vw vw3 vxml wer wir wkf wn wrd wrl wsc wst wtf wtl wtx x20 x60 x70 "
    "x80 x90 xb0 xc0 xct xd0 xdl xdp xfd xff xhtm xlf xsd xsl xslt xsr xwp xy xy3 xyp xyw xyz zanebug zed zhp zib "
    "zw zxe _me xls xlt slk gnumeric docx dotx docm dotm pptx ppsx potx pptm ppsm potm xlsx xltx xlsm xltm odt "
    "ods odp odg odc odf odb odi odm ott ots otp otg otc otf oti oth pages key numbers doc dot ppt pps pot ppa "
    "rtf pdf 7z bz2 gz zip tgz tbz tar rar epub eml msg chm mobi azw3 pdb lit";

constexpr std::string_view kAudio =
    "mp3 mp1 mp2 mpa wma wav ogg m4a aac ac3 ram ra m4p flac aiff aif pcm m4b ape dsf dff m3u wpl pls cue";

constexpr std::string_view kVideo =
    "mpg mpeg avi asf wmv mov flv f4v dat rm rmvb mp4 divx xvid vob mkv ts m2ts m2t mts m4v 3gp 3g2 qt swf dvr-ms "
    "vdr iso ifo trp tp";

constexpr std::string_view kPhotos =
    "jpg jpeg jpe bmp png gif ico tif tiff psd ufo arw srf sr2 dcr k25 kdc cr2 crw nef mrw ptx pef raf 3fr erf "
    "mef mos orf rw2 dng x3f raw";

struct Entry {
  std::string_view extension;
  FileType type = kFileTypeDocument;
};

constexpr size_t kExtensions = 738;
using Table = std::array<Entry, kExtensions>;

size_t Append(Table& table, size_t size, std::string_view extensions, FileType type) {
  for (size_t begin = 0; begin <= extensions.size();) {
    const size_t end = std::min(extensions.find(' ', begin), extensions.size());
    table[size++] = {extensions.substr(begin, end - begin), type};
    begin = end + 1;
  }
  return size;
}

// Sorted by extension. The empty extension, of a name without a dot or with nothing behind it, is a document.
Table MakeTable() {
  Table table;
  size_t size = 1;
  size = Append(table, size, kDocuments, kFileTypeDocument);
  size = Append(table, size, kAudio, kFileTypeAudio);
  size = Append(table, size, kVideo, kFileTypeVideo);
  Append(table, size, kPhotos, kFileTypePhoto);
  std::sort(table.begin(), table.end(), [](const Entry& a, const Entry& b) { return a.extension < b.extension; });
  return table;
}

constexpr size_t Count(std::string_view extensions) {
  return 1 + static_cast<size_t>(std::count(extensions.begin(), extensions.end(), ' '));
}
static_assert(1 + Count(kDocuments) + Count(kAudio) + Count(kVideo) + Count(kPhotos) == kExtensions);

// Made when it is first asked, so that other static objects may ask, too.
const Table& Extensions() {
  static const Table table = MakeTable();
  return table;
}

}  // namespace

FileType GetFileTypeByFullPath(const std::string& full_path) {
  const std::string extension = GetFileExtension(full_path, true);
  const Table& table = Extensions();
  const auto found =
      std::lower_bound(table.begin(), table.end(), extension,
                       [](const Entry& entry, const std::string& name) { return entry.extension < name; });
  return found != table.end() && found->extension == extension ? found->type : kFileTypeOther;
}

std::vector<std::string> ExtensionsOfFileType(FileType type) {
  std::vector<std::string> extensions;
  for (const Entry& entry : Extensions()) {
    if (entry.type == type) extensions.emplace_back(entry.extension);
  }
  return extensions;
}

}  // namespace quarrox::fileindex
