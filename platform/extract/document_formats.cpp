#include "extract/documents.h"
#include "extract/formats.h"

namespace platform::extract {
namespace {

constexpr Format kDocumentFormats[] = {
    {"text/html", ExtractHtml},
    {"application/xhtml+xml", ExtractHtml},
    {"text/xml", ExtractXml},
    {"application/xml", ExtractXml},
    {"image/svg+xml", ExtractXml},
    {"application/vnd.oasis.opendocument.text-flat-xml", ExtractXml},
    {"application/pdf", ExtractPdf},
    {"text/rtf", ExtractRtf},
    {"application/rtf", ExtractRtf},

    {"application/vnd.openxmlformats-officedocument.wordprocessingml.document", ExtractOoxml},
    {"application/vnd.openxmlformats-officedocument.wordprocessingml.template", ExtractOoxml},
    {"application/vnd.openxmlformats-officedocument.presentationml.presentation", ExtractOoxml},
    {"application/vnd.openxmlformats-officedocument.presentationml.slideshow", ExtractOoxml},
    {"application/vnd.openxmlformats-officedocument.presentationml.template", ExtractOoxml},
    {"application/vnd.openxmlformats-officedocument.spreadsheetml.sheet", ExtractOoxml},
    {"application/vnd.openxmlformats-officedocument.spreadsheetml.template", ExtractOoxml},
    {"application/vnd.ms-word.document.macroEnabled.12", ExtractOoxml},
    {"application/vnd.ms-word.template.macroEnabled.12", ExtractOoxml},
    {"application/vnd.ms-powerpoint.presentation.macroEnabled.12", ExtractOoxml},
    {"application/vnd.ms-powerpoint.slideshow.macroEnabled.12", ExtractOoxml},
    {"application/vnd.ms-powerpoint.template.macroEnabled.12", ExtractOoxml},
    {"application/vnd.ms-excel.sheet.macroEnabled.12", ExtractOoxml},
    {"application/vnd.ms-excel.template.macroEnabled.12", ExtractOoxml},
    {"application/vnd.oasis.opendocument.text", ExtractOpenDocument},
    {"application/vnd.oasis.opendocument.text-template", ExtractOpenDocument},
    {"application/vnd.oasis.opendocument.text-master", ExtractOpenDocument},
    {"application/vnd.oasis.opendocument.spreadsheet", ExtractOpenDocument},
    {"application/vnd.oasis.opendocument.spreadsheet-template", ExtractOpenDocument},
    {"application/vnd.oasis.opendocument.presentation", ExtractOpenDocument},
    {"application/vnd.oasis.opendocument.presentation-template", ExtractOpenDocument},
    {"application/vnd.oasis.opendocument.graphics", ExtractOpenDocument},
    {"application/vnd.oasis.opendocument.graphics-template", ExtractOpenDocument},
    {"application/vnd.oasis.opendocument.chart", ExtractOpenDocument},
    {"application/vnd.oasis.opendocument.formula", ExtractOpenDocument},
    {"application/epub+zip", ExtractEpub},

    {"application/msword", ExtractOldOffice},
    {"application/vnd.ms-excel", ExtractOldOffice},
    {"application/vnd.ms-powerpoint", ExtractOldOffice},
    {"application/vnd.ms-office", ExtractOldOffice},
    {"application/x-ole-storage", ExtractOldOffice},
    {"application/CDFV2", ExtractOldOffice},
    {"application/encrypted", ExtractOldOffice},

    {"message/rfc822", ExtractMail},
    {"message/news", ExtractMail},
    {"application/mbox", ExtractMailbox},

    {"application/zip", ExtractArchive},
    {"application/x-tar", ExtractArchive},
    {"application/x-7z-compressed", ExtractArchive},
    {"application/x-rar", ExtractArchive},
    {"application/vnd.rar", ExtractArchive},
    {"application/x-cpio", ExtractArchive},
    {"application/x-iso9660-image", ExtractArchive},
    {"application/vnd.ms-cab-compressed", ExtractArchive},
    {"application/x-lzh-compressed", ExtractArchive},
    {"application/x-lha", ExtractArchive},
    {"application/java-archive", ExtractArchive},
    {"application/vnd.android.package-archive", ExtractArchive},
    {"application/gzip", ExtractArchive},
    {"application/x-bzip2", ExtractArchive},
    {"application/x-xz", ExtractArchive},
    {"application/x-lzma", ExtractArchive},
    {"application/x-lzip", ExtractArchive},
    {"application/x-lz4", ExtractArchive},
    {"application/x-compress", ExtractArchive},
    {"application/zstd", ExtractArchive},
};

}  // namespace

std::span<const Format> DocumentFormats() {
  return kDocumentFormats;
}

}  // namespace platform::extract
