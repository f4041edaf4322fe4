#include "device/archiver/zip_entries.h"

#include <zip.h>

#include <algorithm>
#include <array>
#include <cstring>
#include <functional>
#include <memory>
#include <optional>

#include "device/archiver/failure.h"

namespace Archiver {
namespace {

using Conversion = std::function<std::optional<std::string>(const std::string& name, bool flagged)>;

struct Discard {
  void operator()(zip_t* archive) const { zip_discard(archive); }
};
using Zip = std::unique_ptr<zip_t, Discard>;

std::string Reason(zip_error_t* error) {
  return zip_error_system_type(error) == ZIP_ET_SYS ? std::strerror(zip_error_code_system(error))
                                                    : zip_error_strerror(error);
}

Zip Open(const std::string& path, int flags) {
  int code = 0;
  Zip archive(zip_open(path.c_str(), flags, &code));
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

void Rename(const std::string& path, zip_flags_t encoding, const Conversion& convert) {
  Zip archive = Open(path, 0);
  const zip_int64_t count = zip_get_num_entries(archive.get(), 0);
  bool changed = false;
  for (zip_int64_t i = 0; i < count; ++i) {
    const auto index = static_cast<zip_uint64_t>(i);
    const RawName name = NameOf(archive.get(), index);
    if (name.ascii) {
      continue;
    }
    if (const auto converted = convert(name.bytes, name.flagged)) {
      changed = zip_file_rename(archive.get(), index, converted->c_str(), encoding) == 0 || changed;
    }
  }
  if (!changed) {
    return;
  }
  if (zip_close(archive.get()) != 0) {
    throw Failure(Reason(zip_get_error(archive.get())));
  }
  static_cast<void>(archive.release());  // zip_close has freed it
}

Conversion ToUtf8(const Device::CodePage& page) {
  return [&page](const std::string& name, bool flagged) {
    return flagged ? std::nullopt : page.Decode(name);
  };
}

struct CloseFile {
  void operator()(zip_file_t* file) const { zip_fclose(file); }
};
using Member = std::unique_ptr<zip_file_t, CloseFile>;

// Opening it compares the password with one or two bytes only.
Member OpenMember(zip_t* archive, zip_uint64_t index, const std::string& password) {
  Member member(zip_fopen_index_encrypted(archive, index, 0, password.c_str()));
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

}  // namespace

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

bool HasNamesIn(const Device::CodePage& page, const std::string& archive) {
  const Zip zip = Open(archive, ZIP_RDONLY);
  const zip_int64_t count = zip_get_num_entries(zip.get(), 0);
  for (zip_int64_t i = 0; i < count; ++i) {
    const RawName name = NameOf(zip.get(), static_cast<zip_uint64_t>(i));
    if (!name.ascii && ToUtf8(page)(name.bytes, name.flagged)) {
      return true;
    }
  }
  return false;
}

void NamesToUtf8(const Device::CodePage& page, const std::string& archive) {
  Rename(archive, ZIP_FL_ENC_UTF_8, ToUtf8(page));
}

void NamesToCodePage(const Device::CodePage& page, const std::string& archive) {
  const Conversion from_utf8 = [&page](const std::string& name, bool flagged) {
    return flagged ? page.Encode(name) : std::nullopt;
  };
  Rename(archive, ZIP_FL_ENC_CP437, from_utf8);
}

}  // namespace Archiver
