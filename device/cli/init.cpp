// "init": makes a device, with sample files when nothing else is asked for.
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <iostream>
#include <random>

#include "device/base/file_io.h"
#include "device/base/json_text.h"
#include "device/cli/commands.h"
#include "device/cli/output.h"
#include "device/model/device.h"

namespace Device {

namespace {

namespace fs = std::filesystem;

// Each user's password is the user's name.
constexpr char kSampleConfig[] = R"({
  "volumes": ["vol1", "vol2"],
  "users": [
    { "name": "alice", "uid": 65001, "admin": true, "home": "vol1",
      "password": "$6$samplealice$7IAtO8BBzswsLOQbnatWFfNt84sWsSkm7epmQW48HkhSWCaFTSfsb6O1V0icOlQCaiDp8Vmcz/HnXpU8FY736/" },
    { "name": "bob", "uid": 65002, "home": "vol1", "codepage": "CP932",
      "password": "$6$samplebob$gbYmH/UHuneh2f8m7v2lT6phOuGLjl0UWQEQovenIVq83DqM4AjalW/4LeUcFDKZR25ZaHVjGI1TIu7hqeQF3." },
    { "name": "carol", "uid": 65003, "home": "vol2",
      "password": "$6$samplecarol$m4zk1vuCaPypGXoHmMo7HOIqvpbnNfSHoeT03T2uvZEaFgNqSBoC9bSwjIDWJDPNmsbsa/6zKz4pHnLkMyke.1" }
  ],
  "shares": [
    { "name": "photo", "volume": "vol1",
      "access": { "alice": "rw", "bob": "rw", "carol": "ro" } },
    { "name": "music", "volume": "vol1",
      "access": { "alice": "rw", "bob": "ro", "carol": "list-denied" } },
    { "name": "video", "volume": "vol2",
      "access": { "alice": "rw", "bob": "rw" } },
    { "name": "vault", "volume": "vol2", "encrypted": true,
      "access": { "alice": "rw" } },
    { "name": "attic", "volume": "vol1", "read_only": true,
      "access": { "alice": "rw", "bob": "rw" } }
  ]
}
)";
constexpr uid_t kSampleOwner = 65001;  // alice

constexpr std::size_t kKiB = 1024;
constexpr std::size_t kMiB = 1024 * kKiB;

// With their sizes in bytes.
constexpr std::pair<const char*, std::size_t> kSampleFiles[] = {
    {"vol1/photo/cat.jpg", 300 * kKiB},
    {"vol1/photo/trip/day1/a.jpg", 3 * kMiB},
    {"vol1/photo/trip/day1/b, the second.jpg", 2 * kMiB},
    {"vol1/photo/trip/day1/@eaDir/a.jpg/thumb.jpg", 20 * kKiB},
    {"vol1/photo/trip/日の出.jpg", 4 * kMiB},
    {"vol1/music/album/01 Été.mp3", 5 * kMiB},
    {"vol1/music/album/02.mp3", 6 * kMiB},
    {"vol1/attic/old.txt", kKiB},
    {"vol2/video/clip.mp4", 12 * kMiB},
    {"vol2/vault/letter.txt", kKiB},
    {"vol1/homes/alice/notes.txt", kKiB},
};
constexpr char kSampleEmptyFolder[] = "vol1/photo/trip/empty";

// With their targets.
constexpr std::pair<const char*, const char*> kSampleLinks[] = {
    {"vol1/photo/trip/best.jpg", "day1/a.jpg"},  // inside the shared folder
    {"vol1/photo/host", "/etc"},                 // off the device
};

// Bytes that do not compress, the same in every device.
void WriteNoise(const fs::path& path, std::size_t size) {
  std::mt19937_64 noise(std::hash<std::string>{}(path.filename().string()));
  std::ofstream file(path, std::ios::binary);
  for (std::size_t at = 0; at < size; at += sizeof(std::uint64_t)) {
    const std::uint64_t word = noise();
    file.write(reinterpret_cast<const char*>(&word), std::min(sizeof word, size - at));
  }
  if (!file.flush()) {
    ThrowErrno("sample file '" + path.string() + "'");
  }
}

// Gives what the sample put below a folder of the device to its owner, not the folder itself.
void GiveToOwner(const fs::path& folder) {
  for (const fs::directory_entry& entry : fs::recursive_directory_iterator(folder)) {
    if (geteuid() == 0 && lchown(entry.path().c_str(), kSampleOwner, kUsersGroup) != 0) {
      ThrowErrno("owner of '" + entry.path().string() + "'");
    }
  }
}

void AddSampleFiles(const fs::path& root) {
  for (const auto& [path, size] : kSampleFiles) {
    fs::create_directories((root / path).parent_path());
    WriteNoise(root / path, size);
  }
  fs::create_directories(root / kSampleEmptyFolder);
  for (const auto& [path, target] : kSampleLinks) {
    fs::create_symlink(target, root / path);
  }
  for (const char* folder :
       {"vol1/photo", "vol1/music", "vol1/attic", "vol2/video", "vol2/vault", "vol1/homes/alice"}) {
    GiveToOwner(root / folder);
  }
}

}  // namespace

int InitCommand(const Target& target, const std::string& config_file) {
  umask(0022);
  if (!config_file.empty()) {
    Make(target.folder, ReadTextFile(config_file));
  } else {
    Make(target.folder, kSampleConfig);
    AddSampleFiles(target.folder);
  }
  if (target.is_json) {
    PrintJson(JsonObject({{"device", target.folder}}));
  } else if (!target.is_quiet) {
    std::cerr << "made device '" << target.folder << "'\n";
  }
  return kExitDone;
}

}  // namespace Device
