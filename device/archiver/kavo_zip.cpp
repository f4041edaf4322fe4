// kavo-zip: see zip_program.h. Everything here throws Failure with the reason alone.
//
// In a zip, a name is UTF-8 when its entry is flagged so, and in some code page otherwise. To put a
// name into another form changes name and flag only and keeps everything else of an entry, and the
// archive is written anew only when there is something to change. A name that cannot be converted,
// or whose converted form another entry bears, stays as it is.

#include <zip.h>

#include <algorithm>
#include <array>
#include <cstring>
#include <exception>
#include <functional>
#include <iostream>
#include <iterator>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "device/archiver/failure.h"
#include "device/archiver/zip_program.h"
#include "device/base/code_page.h"

namespace Archiver {
namespace {

// The form that a name is to have; nothing when it stays.
using Conversion = std::function<std::optional<std::string>(const std::string& name, bool flagged)>;

using Zip = std::unique_ptr<zip_t, void (*)(zip_t*)>;
using Member = std::unique_ptr<zip_file_t, int (*)(zip_file_t*)>;

std::string Reason(zip_error_t* error) {
  return zip_error_system_type(error) == ZIP_ET_SYS ? std::strerror(zip_error_code_system(error))
                                                    : zip_error_strerror(error);
}

Zip Open(const std::string& path, int flags) {
  int code = 0;
  Zip archive(zip_open(path.c_str(), flags, &code), zip_discard);
  if (!archive) {
    zip_error_t error;
    zip_error_init_with_code(&error, code);
    const std::string reason = Reason(&error);
    zip_error_fini(&error);
    throw Failure(reason);
  }
  return archive;
}

struct RawName {
  std::string bytes;
  bool ascii;
  bool flagged;  // as UTF-8
};

RawName NameOf(zip_t* archive, zip_uint64_t index) {
  const char* raw = zip_get_name(archive, index, ZIP_FL_ENC_RAW);
  RawName name{raw == nullptr ? "" : raw, true, false};
  name.ascii = std::all_of(name.bytes.begin(), name.bytes.end(),
                           [](char c) { return static_cast<unsigned char>(c) < 0x80; });
  if (!name.ascii) {
    // Asked to be strict, libzip takes a name without the flag for CP437 and converts it.
    const char* strict = zip_get_name(archive, index, ZIP_FL_ENC_STRICT);
    name.flagged = strict != nullptr && name.bytes == strict;
  }
  return name;
}

// The new forms of the names that are to change, by the entry's index.
std::map<zip_uint64_t, std::string> Changes(zip_t* archive, const Conversion& convert) {
  std::map<zip_uint64_t, std::string> changes;
  const auto count = static_cast<zip_uint64_t>(zip_get_num_entries(archive, 0));
  for (zip_uint64_t index = 0; index < count; ++index) {
    const RawName name = NameOf(archive, index);
    if (auto converted = name.ascii ? std::nullopt : convert(name.bytes, name.flagged)) {
      changes.emplace(index, *std::move(converted));
    }
  }
  return changes;
}

void Rename(const std::string& path, zip_flags_t encoding, const Conversion& convert) {
  Zip archive = Open(path, 0);
  bool changed = false;
  for (const auto& [index, name] : Changes(archive.get(), convert)) {
    changed = zip_file_rename(archive.get(), index, name.c_str(), encoding) == 0 || changed;
  }
  if (!changed) {
    return;
  }
  if (zip_close(archive.get()) != 0) {
    throw Failure(Reason(zip_get_error(archive.get())));
  }
  static_cast<void>(archive.release());  // zip_close has freed it
}

// Opening it compares the password with one or two bytes only.
Member OpenMember(zip_t* archive, zip_uint64_t index, const std::string& password) {
  Member member(zip_fopen_index_encrypted(archive, index, 0, password.c_str()), zip_fclose);
  if (!member) {
    throw Failure("member '" + NameInError(NameOf(archive, index).bytes) +
                  "': " + Reason(zip_get_error(archive)));
  }
  return member;
}

// To the end, where its checksum is compared.
bool IsReadable(zip_file_t* member) {
  std::array<char, 65536> block{};
  zip_int64_t got = 1;
  while (got > 0) {
    got = zip_fread(member, block.data(), block.size());
  }
  return got == 0;
}

// Throws when a member is protected by another password, or by one where none is given: new members
// would lie under another password than the old ones, or in clear beside them.
void CheckMembers(const std::string& archive, const std::string& password) {
  const Zip zip = Open(archive, ZIP_RDONLY);
  std::optional<zip_stat_t> smallest;
  for (zip_int64_t i = zip_get_num_entries(zip.get(), 0); --i >= 0;) {
    zip_stat_t member{};
    zip_stat_init(&member);
    if (zip_stat_index(zip.get(), static_cast<zip_uint64_t>(i), 0, &member) != 0) {
      throw Failure(Reason(zip_get_error(zip.get())));
    }
    if (member.encryption_method == ZIP_EM_NONE) {
      continue;
    }
    if (password.empty()) {
      throw Failure("it is protected by a password, and none is given");
    }
    OpenMember(zip.get(), member.index, password);
    // Of these a wrong password passes for the right one once in 256 times.
    if (member.encryption_method == ZIP_EM_TRAD_PKWARE && member.size > 0 &&
        (!smallest || member.size < smallest->size)) {
      smallest = member;
    }
  }
  if (smallest && !IsReadable(OpenMember(zip.get(), smallest->index, password).get())) {
    throw Failure("it is protected by another password");
  }
}

int Run(const std::string& command, const std::string& archive, const std::string& page_name) {
  const auto page =
      Device::CodePage::IsUtf8(page_name) ? nullptr : Device::CodePage::Open(page_name);
  const Conversion to_utf8 = [&](const std::string& name, bool flagged) {
    return flagged ? std::nullopt : page->Decode(name);
  };
  const Conversion to_page = [&](const std::string& name, bool flagged) {
    return flagged ? page->Encode(name) : std::nullopt;
  };
  if (command == kZipCheck) {
    CheckMembers(archive, std::string(std::istreambuf_iterator<char>(std::cin), {}));
    return page && !Changes(Open(archive, ZIP_RDONLY).get(), to_utf8).empty() ? kZipNo : kZipYes;
  }
  if (command == kZipToUtf8 && page) {
    Rename(archive, ZIP_FL_ENC_UTF_8, to_utf8);
    return kZipYes;
  }
  if (command == kZipToCodePage && page) {
    Rename(archive, ZIP_FL_ENC_CP437, to_page);
    return kZipYes;
  }
  throw Failure("unknown command '" + command + "'");
}

}  // namespace
}  // namespace Archiver

int main(int argc, char** argv) {
  const std::vector<std::string> arguments(argv, argv + argc);
  constexpr std::size_t kArguments = 4;
  try {
    if (arguments.size() != kArguments) {
      throw Archiver::Failure("usage: kavo-zip COMMAND ARCHIVE CODE-PAGE");
    }
    return Archiver::Run(arguments[1], arguments[2], arguments[3]);
  } catch (const std::exception& error) {
    std::cerr << error.what();
    return Archiver::kZipFailed;
  }
}
