// File-system type codes of the Linux platform: the statfs magic number,
// with the mount table consulted where one magic covers several kinds
// (FUSE mounts, tmpfs and devtmpfs).
#include <sys/vfs.h>

#include <cerrno>
#include <cstdint>
#include <cstring>
#include <map>
#include <set>

#include "platform/linux/linux_platform.h"
#include "platform/linux/mount_table.h"

namespace corvlumex {
namespace platform {
namespace {

constexpr uint32_t kFuseMagic = 0x65735546;
constexpr uint32_t kTmpfsMagic = 0x01021994;

const std::map<uint32_t, FsTypeCode>& MagicTable() {
  static const std::map<uint32_t, FsTypeCode> table = {
      // Local disks and memory.
      {0xEF53, kFsExt}, {0x9123683E, kFsBtrfs}, {0x58465342, kFsXfs}, {kTmpfsMagic, kFsTmpfs},
      {0x858458F6, kFsTmpfs} /* ramfs */, {0x4D44, kFsVfat}, {0x2011BAB0, kFsExfat},
      {0x5346544E, kFsNtfs}, {0x7366746E, kFsNtfs} /* ntfs3 */, {0x2FC12FC1, kFsZfs}, {0xF2F52010, kFsF2fs},
      {0x794C7630, kFsOverlay}, {kFuseMagic, kFsFuseLocal},
      {0x3153464A, kFsOtherLocal} /* jfs */, {0x52654973, kFsOtherLocal} /* reiserfs */,
      {0x3434, kFsOtherLocal} /* nilfs2 */, {0x4244, kFsOtherLocal} /* hfs */, {0x482B, kFsOtherLocal} /* hfs+ */,
      {0xCA451A4E, kFsOtherLocal} /* bcachefs */, {0x01161970, kFsOtherLocal} /* gfs2 */,
      {0x7461636F, kFsOtherLocal} /* ocfs2 */,
      // Kernel pseudo file systems.
      {0x9FA0, kFsPseudo} /* proc */, {0x62656572, kFsPseudo} /* sysfs */, {0x1CD1, kFsPseudo} /* devpts */,
      {0x27E0EB, kFsPseudo} /* cgroup */, {0x63677270, kFsPseudo} /* cgroup2 */,
      {0x64626720, kFsPseudo} /* debugfs */, {0x73636673, kFsPseudo} /* securityfs */,
      {0x74726163, kFsPseudo} /* tracefs */, {0xCAFE4A11, kFsPseudo} /* bpf */,
      {0x6165676C, kFsPseudo} /* pstore */, {0x62656570, kFsPseudo} /* configfs */,
      {0x19800202, kFsPseudo} /* mqueue */, {0x958458F6, kFsPseudo} /* hugetlbfs */,
      {0x0187, kFsPseudo} /* autofs */, {0xDE5E81E4, kFsPseudo} /* efivarfs */,
      {0x42494E4D, kFsPseudo} /* binfmt_misc */, {0x6E736673, kFsPseudo} /* nsfs */,
      {0xF97CFF8C, kFsPseudo} /* selinuxfs */, {0x65735543, kFsPseudo} /* fusectl */,
      {0x67596969, kFsPseudo} /* rpc_pipefs */, {0x43415D53, kFsPseudo} /* smackfs */,
      // Remote file systems.
      {0x6969, kFsNfs}, {0x517B, kFsSmb}, {0xFF534D42, kFsSmb} /* cifs */, {0xFE534D42, kFsSmb} /* smb2/3 */,
      {0x01021997, kFs9p}, {0x00C36400, kFsCeph}, {0x5346414F, kFsAfs}, {0x6B414653, kFsAfs} /* kafs */,
      {0x73757245, kFsOtherRemote} /* coda */, {0x0BD00BD0, kFsOtherRemote} /* lustre */,
      {0x564C, kFsOtherRemote} /* ncp */, {0x20030528, kFsOtherRemote} /* orangefs */,
      {0x19830326, kFsOtherRemote} /* beegfs */,
      // Images.
      {0x9660, kFsIso9660}, {0x15013346, kFsUdf}, {0x73717368, kFsSquashfs}, {0x28CD3D45, kFsCramfs},
      {0x453DCD28, kFsCramfs} /* other byte order */, {0xE0F5E1E2, kFsErofs}, {0x7275, kFsRomfs},
  };
  return table;
}

// FUSE helpers by the subtype the mount table shows ("fuse.sshfs" -> "sshfs").
FsTypeCode FuseCode(const std::string& subtype) {
  static const std::set<std::string> network = {
      "sshfs", "rclone", "s3fs", "gcsfuse", "goofys", "curlftpfs", "davfs", "glusterfs", "ceph-fuse",
      "ceph", "smbnetfs", "juicefs", "lizardfs", "mfs", "moosefs", "seaweedfs", "blobfuse", "blobfuse2",
      "cvmfs", "httpfs", "httpdirfs", "onedriver", "google-drive-ocamlfuse", "gvfsd-fuse", "afpfs",
      "afpfs-ng", "nfs", "nfs-ganesha", "wdfs", "cloudfuse"};
  static const std::map<std::string, FsTypeCode> images = {
      {"fuseiso", kFsIso9660}, {"squashfuse", kFsSquashfs}, {"squashfuse_ll", kFsSquashfs},
      {"erofsfuse", kFsErofs}, {"archivemount", kFsArchive}, {"fuse-zip", kFsArchive}};
  if (network.count(subtype)) return kFsFuseNetwork;
  const auto image = images.find(subtype);
  return image == images.end() ? kFsFuseLocal : image->second;
}

}  // namespace

bool LinuxPlatform::StatfsMagic(const std::string& path, long* magic) {
  struct statfs st;
  if (statfs(path.c_str(), &st) != 0) return false;
  *magic = static_cast<long>(st.f_type);
  return true;
}

std::string LinuxPlatform::MountTypeName(const std::string& path) {
  MountEntry entry;
  return FindMountOf(path, &entry) ? entry.type : std::string();
}

int LinuxPlatform::GetFSType(const std::string& path, int) {
  long magic = 0;
  if (path.empty() || !StatfsMagic(path, &magic)) {
    CORV_PLATFORM_ERROR(kPlatformErrSystem, "statfs failed for \"" + path + "\": " + strerror(errno));
    return -1;
  }
  const uint32_t key = static_cast<uint32_t>(magic);
  const auto found = MagicTable().find(key);
  const FsTypeCode code = found == MagicTable().end() ? kFsUnknown : found->second;
  if (key == kFuseMagic || key == kTmpfsMagic) {
    const std::string type = MountTypeName(path);
    if (key == kTmpfsMagic) return type == "devtmpfs" ? kFsPseudo : code;
    const size_t dot = type.find('.');
    if (dot != std::string::npos) return FuseCode(type.substr(dot + 1));
  }
  return code;
}

int LinuxPlatform::FSIsRemoteFS(int type) {
  switch (type) {
    case kFsNfs: case kFsSmb: case kFsFuseNetwork: case kFs9p: case kFsCeph: case kFsAfs: case kFsOtherRemote:
      return 1;
    default:
      return 0;
  }
}

int LinuxPlatform::FSIsImageFS(int type) {
  switch (type) {
    case kFsIso9660: case kFsUdf: case kFsSquashfs: case kFsCramfs: case kFsErofs: case kFsRomfs: case kFsArchive:
      return 1;
    default:
      return 0;
  }
}

}  // namespace platform
}  // namespace corvlumex
