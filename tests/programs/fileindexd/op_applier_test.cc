// The operation table of fileindexd, command by command, against a scripted
// search daemon; extraction is a stand-in platform answer.
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <filesystem>
#include <fstream>
#include <functional>
#include <memory>
#include <thread>

#include "common/error.h"
#include "fileindex/elastic/daemon_codes.h"
#include "fileindex/queue/optree.h"
#include "fileindex/state/folder_mgr.h"
#include "platform/linux/linux_platform.h"
#include "tests/support/fake_platform.h"
#include "fileindex/elastic/elastic_control.h"
#include "fileindex/queue/custom_event.h"
#include "programs/fileindexd/fresh_lane.h"
#include "programs/fileindexd/share_worker.h"
#include "programs/fileindexd/index_rules.h"
#include "programs/fileindexd/op_applier.h"
#include "programs/fileindexd/progress.h"
#include "programs/fileindexd/settle_tracker.h"
#include "tests/fileindex/elastic/fake_search_daemon.h"
#include "tests/support/sandbox.h"

namespace corvlumex {
namespace fileindexd {
namespace {
namespace fs = std::filesystem;
using testing_support::FakeAnswer;
using Lines = std::vector<std::string>;

class OpApplierTest : public ::testing::Test {
 protected:
  void SetUp() override {
    // Extraction without the worker: the document of a file is its path
    // fields; a file named "broken.c" cannot be read.
    platform_->ParseFileHook = [](const std::string& path, const Json::Value&, Json::Value& document) {
      if (fs::path(path).filename() == "broken.c") throw std::runtime_error("not a readable file");
      document["CORVMDPath"] = path;
      document["CORVMDFSName"] = fs::path(path).filename().string();
    };
    share_ = root_.AddShare("share");
    root_.MakeDir("volume1/share/docs");
    root_.WriteFile("var/packages/CorvLumex/etc/fileindex.folders",
                    R"([{"path": "/share/docs", "name": "docs", "document": false, "audio": true, "video": true, "photo": true}])");
    folders_ = std::make_unique<fileindex::FolderMgr>();
    rules_ = std::make_unique<IndexRules>(*folders_, share_);
    settle_ = std::make_unique<SettleTracker>(root_.path() + "/settle", SettleOptions());
    applier_ = std::make_unique<OpApplier>("share", *rules_, progress_, *settle_);
    daemon_.SetHandler(testing_support::AnswerSuccess);
  }

  std::string Docs(const std::string& name) const { return share_ + "/docs/" + name; }
  // "command doc_id" (or the query's prefix) of each request.
  std::vector<std::string> Sent() const {
    std::vector<std::string> out;
    for (const Json::Value& request : daemon_.Requests()) {
      const Json::Value& data = request["data"];
      std::string target = data["doc_id"].asString();
      if (target.empty()) target = data["query"]["qsl"]["prefix"]["CORVMDPath"].asString();
      out.push_back(request["command"].asString() + " " + target);
    }
    return out;
  }

  // The sorted paths of the upserts that reached the daemon inside
  // compounds (a walk's documents travel so, from two threads), and how many
  // requests carried them.
  Lines Upserted(size_t* requests = nullptr) const {
    Lines paths;
    size_t compounds = 0;
    for (const Json::Value& request : daemon_.Requests()) {
      compounds += request.isMember("compound") ? 1 : 0;
      for (const Json::Value& element : request["compound"]) {
        if (element["command"] == "document_upsert_by_id") paths.push_back(element["data"]["doc_id"].asString());
      }
    }
    std::sort(paths.begin(), paths.end());
    if (requests != nullptr) *requests = compounds;
    return paths;
  }
  // Answers each compound element by `element_fails` (its error, or null for
  // success); other requests succeed.
  void AnswerCompounds(const std::function<Json::Value(const Json::Value&)>& element_fails) {
    daemon_.SetHandler([element_fails](const Json::Value& request) {
      if (!request.isMember("compound")) return FakeAnswer::Success(Json::Value(Json::arrayValue));
      Json::Value answer(Json::objectValue);
      answer["success"] = true;
      answer["has_fail"] = false;
      for (const Json::Value& element : request["compound"]) {
        Json::Value sub(Json::objectValue);
        const Json::Value error = element_fails(element);
        sub["success"] = error.isNull();
        if (!error.isNull()) {
          sub["error"] = error;
          answer["has_fail"] = true;
        }
        answer["data"].append(sub);
      }
      return FakeAnswer::Json(answer);
    });
  }

  testing_support::Sandbox root_;
  testing_support::ScopedFakePlatform platform_;
  testing_support::LogCapture log_;
  testing_support::FakeSearchDaemon daemon_;
  std::string share_;
  std::unique_ptr<fileindex::FolderMgr> folders_;
  std::unique_ptr<IndexRules> rules_;
  ProgressBoard progress_;
  std::unique_ptr<SettleTracker> settle_;
  std::unique_ptr<OpApplier> applier_;
};

// Each operation on one file: what reaches the search daemon, by what is on
// disk and what the index answers.
TEST_F(OpApplierTest, EachOperationSendsWhatTheDiskAndTheIndexCallFor) {
  root_.MakeDir("volume1/share/docs/@tmp");
  for (const char* name : {"main.c", "notes.txt", "attr.c", "new.c", "@tmp/hidden.c", "back.c"}) {
    root_.WriteFile("volume1/share/docs/" + std::string(name), "x");
  }
  const FakeAnswer not_found =
      FakeAnswer::Failure(elasticd::kCodeDocumentNotFound, "No document with the id");
  const std::string set = "document_set_by_id ", upsert = "document_upsert_by_id ",
                    del = "document_del_by_id ", del_below = "document_del_by_query ";
  struct Case {
    const char* name;
    std::function<void()> apply;
    std::vector<FakeAnswer> answers;
    Lines expected;
  };
  const Case cases[] = {
      {"a file of no category is stored", [&] { applier_->Upsert(Docs("main.c")); }, {},
       {upsert + Docs("main.c")}},
      // Documents are off in docs/.
      {"a file of a category switched off is deleted", [&] { applier_->Upsert(Docs("notes.txt")); },
       {}, {del + Docs("notes.txt")}},
      {"a file gone from disk is cleared with what was below it",
       [&] { applier_->Upsert(Docs("gone")); }, {},
       {del + Docs("gone"), del_below + Docs("gone") + "/"}},
      {"an attribute change of a file never stored stores it whole",
       [&] { applier_->Attr(Docs("attr.c")); }, {not_found},
       {set + Docs("attr.c"), upsert + Docs("attr.c")}},
      {"a rename without an old document is read from disk",
       [&] { applier_->Rename(Docs("old.c"), Docs("new.c")); }, {not_found},
       {set + Docs("old.c"), del + Docs("old.c"), del_below + Docs("old.c") + "/",
        upsert + Docs("new.c")}},
      {"a rename into a hidden folder removes the documents",
       [&] { applier_->Rename(Docs("hidden.c"), Docs("@tmp/hidden.c")); }, {},
       {del + Docs("hidden.c"), del_below + Docs("hidden.c") + "/", del + Docs("@tmp/hidden.c"),
        del_below + Docs("@tmp/hidden.c") + "/"}},
      // Restored from a recycle bin or a hidden folder: indexed again.
      {"a rename out of a hidden folder stores the file",
       [&] { applier_->Rename(Docs("@tmp/back.c"), Docs("back.c")); }, {},
       {del + Docs("@tmp/back.c"), del_below + Docs("@tmp/back.c") + "/", upsert + Docs("back.c")}},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    const size_t before = daemon_.Requests().size();
    for (const FakeAnswer& answer : c.answers) daemon_.Enqueue(answer);
    c.apply();
    const Lines sent = Sent();
    EXPECT_EQ(Lines(sent.begin() + before, sent.end()), c.expected);
  }
}

// After a crash a rename is applied again over what its first run already
// moved, or its target has moved on: whatever the index still holds under an
// old name that is gone from disk is removed, whether the move found a document.
TEST_F(OpApplierTest, ARenameWhoseSourceIsGoneRemovesWhatIsLeftUnderIt) {
  root_.WriteFile("volume1/share/docs/C.c", "x");
  Json::Value below(Json::arrayValue);
  below.append(Json::Value(Json::objectValue));
  below[0]["CORVMDPath"] = Docs("B/f.c");
  below[0]["CORVMDFSName"] = "f.c";
  below[0]["CORVMDParent"] = Docs("B");
  const std::string set = "document_set_by_id " + Docs("B");
  const std::string listed = "document_get_by_query " + Docs("B") + "/";
  const std::string compound = " ";  // carries no command of its own
  const std::string del = "document_del_by_id " + Docs("B");
  const std::string del_below = "document_del_by_query " + Docs("B") + "/";
  struct Case {
    const char* name;
    const char* to;
    bool old_document;  // B's own document is still there to move
    Lines expected;
  };
  const std::vector<Case> cases = {
      {"target gone, no old document", "gone", false, Lines{set, del, del_below}},
      {"target gone, old document moved", "gone", true, Lines{set, listed, compound, del, del_below}},
      {"target there, old document moved", "C.c", true, Lines{set, listed, compound, del, del_below}},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    const size_t before = daemon_.Requests().size();
    if (c.old_document) {
      daemon_.Enqueue(FakeAnswer::Success(Json::Value(Json::objectValue)));
      daemon_.Enqueue(FakeAnswer::Success(below));
    } else {
      daemon_.Enqueue(FakeAnswer::Failure(elasticd::kCodeDocumentNotFound, "No document with the id"));
    }
    applier_->Rename(Docs("B"), Docs(c.to));
    const Lines sent = Sent();
    EXPECT_EQ(Lines(sent.begin() + before, sent.end()), c.expected);
  }
}

// A file with three names, changed through one: the others the index holds
// get the new document (attributes only for an attribute change); a name
// that is no longer this file is left to its own events.
TEST_F(OpApplierTest, AChangeThroughOneHardLinkReachesItsOtherNames) {
  root_.WriteFile("volume1/share/docs/a.c", "x");
  root_.WriteFile("volume1/share/docs/other.c", "another file");
  ASSERT_EQ(link(Docs("a.c").c_str(), Docs("b.c").c_str()), 0);
  ASSERT_EQ(link(Docs("a.c").c_str(), Docs("c.c").c_str()), 0);
  Json::Value names(Json::arrayValue);
  for (const char* name : {"a.c", "b.c", "c.c", "other.c"}) {
    Json::Value doc(Json::objectValue);
    doc["CORVMDPath"] = Docs(name);
    names.append(doc);
  }
  struct Case {
    const char* name;
    std::function<void()> apply;
    std::string command;
  };
  const std::vector<Case> cases = {
      {"upsert", [&] { applier_->Upsert(Docs("a.c")); }, "document_upsert_by_id "},
      {"attributes", [&] { applier_->Attr(Docs("a.c")); }, "document_set_by_id "},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    const size_t before = daemon_.Requests().size();
    daemon_.Enqueue(FakeAnswer::Success(Json::Value(Json::objectValue)));
    daemon_.Enqueue(FakeAnswer::Success(names));
    c.apply();
    const Lines sent = Sent();
    EXPECT_EQ(Lines(sent.begin() + before, sent.end()),
              (Lines{c.command + Docs("a.c"), "document_get_by_query ", c.command + Docs("b.c"), c.command + Docs("c.c")}));
  }
  // The query asks for the file's identity, which every stored document carries.
  const Json::Value query = daemon_.Requests()[1]["data"]["query"]["qsl"]["term"]["CORVMDFSFileID"];
  EXPECT_TRUE(query.isString() && !query.asString().empty()) << daemon_.Requests()[1];
  EXPECT_EQ(daemon_.Requests()[0]["data"]["data"]["CORVMDFSFileID"], query);
}

// The fresh lane reads what the notifier appended to the live queue: the
// files of a folder with few new lines are stored (or their documents
// deleted) and committed; bulk folders, renames and folders wait for the
// in-order pass; a file is refreshed again only when it changed.
TEST_F(OpApplierTest, TheFreshLaneStoresTheFilesOfSmallGroupsOnly) {
  const std::string queue = root_.path() + "/fileindex.queue";
  const auto line = [](int event, const std::string& path, bool is_dir = false) {
    return R"({"event": )" + std::to_string(event) + R"(, "is_dir": )" + (is_dir ? "true" : "false") +
           R"(, "path": ")" + path + "\"}\n";
  };
  root_.WriteFile("volume1/share/docs/new.c", "fresh");
  root_.MakeDir("volume1/share/docs/bulk");
  std::string lines = line(0x40, Docs("new.c")) + line(0x80, Docs("gone.c")) + line(0x40, Docs("bulk"), true) +
                      R"({"event": 256, "path": ")" + Docs("moved.c") + R"(", "path_old": ")" + Docs("was.c") + "\"}\n";
  for (int i = 0; i < 9; ++i) {
    root_.WriteFile("volume1/share/docs/bulk/f" + std::to_string(i) + ".c", "bulk");
    lines += line(0x40, Docs("bulk/f" + std::to_string(i) + ".c"));
  }
  root_.WriteFile("fileindex.queue", lines + R"({"event": 2, "path": ")" + Docs("new"));
  FreshLane lane("share", queue, *applier_, FreshLaneOptions());
  EXPECT_EQ(lane.Look(), 2u);
  EXPECT_EQ(Sent(), (Lines{"document_upsert_by_id " + Docs("new.c"), "document_del_by_id " + Docs("gone.c"), "commit "}));

  // The half line, completed, names the same unchanged file: nothing to do.
  std::ofstream(queue, std::ios::app) << ".c\"}\n" << line(0x2, Docs("new.c"));
  EXPECT_EQ(lane.Look(), 0u);
  // Changed since: stored again.
  root_.WriteFile("volume1/share/docs/new.c", "fresher and longer");
  std::ofstream(queue, std::ios::app) << line(0x2, Docs("new.c"));
  EXPECT_EQ(lane.Look(), 1u);
  EXPECT_EQ(daemon_.Requests().size(), 5u);
}

TEST_F(OpApplierTest, AReindexStoresWhatChangedAndDeletesWhatIsGone) {
  root_.MakeDir("volume1/share/docs/sub");
  root_.WriteFile("volume1/share/docs/sub/same.c", "same");
  root_.WriteFile("volume1/share/docs/sub/new.c", "new");
  struct stat st;
  ASSERT_EQ(lstat(Docs("sub/same.c").c_str(), &st), 0);
  Json::Value listed(Json::arrayValue);
  Json::Value same(Json::objectValue);
  same["CORVMDPath"] = Docs("sub/same.c");
  same["CORVMDFSContentChangeDate"] = static_cast<Json::Int64>(st.st_mtime);
  same["CORVMDAttributeChangeDate"] = static_cast<Json::Int64>(st.st_ctime);
  same["CORVMDFSSize"] = static_cast<Json::Int64>(st.st_size);
  listed.append(same);
  Json::Value stale(Json::objectValue);
  stale["CORVMDPath"] = Docs("sub/stale.c");
  listed.append(stale);
  daemon_.Enqueue(FakeAnswer::Success(listed));
  applier_->SetWalkThreads(2);
  applier_->Reindex(Docs("sub"));
  const Lines commands = Sent();
  ASSERT_GE(commands.size(), 3u);
  EXPECT_EQ(commands.front(), "document_get_by_query " + Docs("sub") + "/");
  EXPECT_EQ(commands.back(), "document_del_by_id " + Docs("sub/stale.c"));
  EXPECT_EQ(Upserted(), Lines({Docs("sub"), Docs("sub/new.c")}));
}

// A walk's documents travel several to a request; the answer of each counts
// for its own file, and an index failure inside a compound stops the walk.
TEST_F(OpApplierTest, AWalksDocumentsTravelTogetherAndEachAnswerCounts) {
  root_.MakeDir("volume1/share/docs/sub");
  Lines expected = {Docs("sub")};
  for (int i = 0; i < 20; ++i) {
    root_.WriteFile("volume1/share/docs/sub/f" + std::to_string(i) + ".c", "x");
    expected.push_back(Docs("sub/f" + std::to_string(i) + ".c"));
  }
  std::sort(expected.begin(), expected.end());
  Json::Value refusal;
  refusal["code"] = elasticd::kCodeBadArgument;
  refusal["msg"] = "field of the wrong type";
  AnswerCompounds([&](const Json::Value& element) {
    return element["data"]["doc_id"] == Docs("sub/f7.c") ? refusal : Json::Value();
  });
  applier_->SetWalkThreads(2);
  applier_->Reindex(Docs("sub"));
  size_t requests = 0;
  EXPECT_EQ(Upserted(&requests), expected);
  EXPECT_LE(requests, expected.size());
  EXPECT_EQ(progress_.Snapshot()["share"]["total_failed"].asUInt64(), 1u);
  EXPECT_EQ(log_.Matching("upsert of " + Docs("sub/f7.c") + " skipped: code=" +
                          std::to_string(elasticd::kCodeBadArgument)).size(), 1u);

  Json::Value missing_index;
  missing_index["code"] = elasticd::kCodeIndexNotFound;
  missing_index["msg"] = "No index fileindex_share";
  AnswerCompounds([&](const Json::Value&) { return missing_index; });
  EXPECT_EQ(testing_support::ErrorOrNone([&] { applier_->Reindex(Docs("sub")); }).code,
            elasticd::kCodeIndexNotFound);
  EXPECT_EQ(progress_.Snapshot()["share"]["total_failed"].asUInt64(), 1u) << "no file is skipped for it";
}

TEST_F(OpApplierTest, OneFileFailsAloneButAnIndexFailureStopsTheBatch) {
  root_.WriteFile("volume1/share/docs/broken.c", "x");
  root_.WriteFile("volume1/share/docs/ok.c", "x");
  applier_->Upsert(Docs("broken.c"));  // extraction fails: logged and skipped
  EXPECT_EQ(progress_.Snapshot()["share"]["total_failed"].asUInt64(), 1u);
  EXPECT_EQ(log_.Matching("upsert of " + Docs("broken.c") + " skipped: code=914").size(), 1u);
  daemon_.Enqueue(FakeAnswer::Failure(elasticd::kCodeIndexNotFound, "No index fileindex_share"));
  try {
    applier_->Upsert(Docs("ok.c"));
    FAIL() << "a missing index must stop the batch";
  } catch (const Error& error) {
    EXPECT_EQ(error.code, elasticd::kCodeIndexNotFound);
  }
}

// A round judges its batch by the folder settings read after it took the
// queue over: a settings change saved (and its event queued) while the round
// waited for the search daemon is applied with the new settings, not the old.
TEST_F(OpApplierTest, ARoundAppliesASettingsChangeWithTheSettingsItSaved) {
  const std::string folders_file = "var/packages/CorvLumex/etc/fileindex.folders";
  const auto save_folder = [&](bool documents) {
    root_.WriteFile(folders_file,
                    std::string(R"([{"path": "/share/docs", "name": "docs", "document": )") +
                        (documents ? "true" : "false") + R"(, "audio": true, "video": true, "photo": true}])");
  };
  save_folder(true);
  root_.WriteFile("volume1/share/docs/notes.txt", "x");
  std::atomic<int> probes{0};
  daemon_.SetHandler([&](const Json::Value& request) {
    if (request["command"] != "index_list") return testing_support::AnswerSuccess(request);
    Json::Value opening(Json::arrayValue);
    if (probes++ == 0) {
      // What `folder set --document off` does, while the round waits.
      save_folder(false);
      Json::Value changed;
      changed["document"] = true;
      fileindex::AddCustomEvent(fileindex::kEventUpdateCfg, share_ + "/docs", "", changed);
      opening[0]["id"] = fileindex::elastic::GetFileIndexID("share");
      opening[0]["state"] = "opening";
    }
    return FakeAnswer::Success(opening);
  });
  PauseState pause;
  WorkerOptions options;
  options.reconnect_probe = std::chrono::milliseconds(10);
  ShareWorker worker("share", options, pause, progress_);
  worker.Start();
  const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(30);
  const auto sent_for_notes = [&] {
    for (const std::string& line : Sent()) {
      if (line.find(Docs("notes.txt")) != std::string::npos) return line;
    }
    for (const std::string& path : Upserted()) {
      if (path == Docs("notes.txt")) return "document_upsert_by_id " + path;
    }
    return std::string();
  };
  while (sent_for_notes().empty() && std::chrono::steady_clock::now() < deadline) {
    std::this_thread::sleep_for(std::chrono::milliseconds(10));
  }
  worker.Stop();
  EXPECT_EQ(sent_for_notes(), "document_del_by_id " + Docs("notes.txt"))
      << "requests: " << ::testing::PrintToString(Sent());
}

}  // namespace
}  // namespace fileindexd
}  // namespace corvlumex
