// Sample files for the extraction tests, made at test time: documents are
// written here (PDF by hand, zip containers with libarchive); audio, video
// and photos come from Debian's ffmpeg and exiftool.
#pragma once

#include <map>
#include <vector>
#include <string>

namespace corvlumex {
namespace testing_support {

// Writes `content` to `path` (bytes as they are).
void WriteBytes(const std::string& path, const std::string& content);
std::string ReadBytes(const std::string& path);

// A one-page PDF per entry of `pages`, with an information dictionary.
void MakePdf(const std::string& path, const std::vector<std::string>& pages, const std::string& title,
             const std::string& author);

// A zip container with the given parts (name -> content), deflated.
void MakeZip(const std::string& path, const std::map<std::string, std::string>& parts);
// `data` compressed into `path` with the filter of `suffix` (gz, bz2, xz, zst).
void WriteCompressed(const std::string& path, const std::string& suffix, const std::string& data);

// Minimal documents of each office format holding `paragraphs`, with title and author.
void MakeOffice(const std::string& path, const std::string& format, const std::vector<std::string>& paragraphs,
                const std::string& title, const std::string& author);

// Runs a shell command; fails the test when it does not exit 0.
void RunTool(const std::string& command);

// The first `size` bytes of `from` written to `to`.
void Truncate(const std::string& from, const std::string& to, size_t size);

}  // namespace testing_support
}  // namespace corvlumex
