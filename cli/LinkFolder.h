#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <set>
#include <string>
#include <string_view>

#include "platform/FileDescriptor.h"
#include "platform/TLError.h"

namespace cli {

// A message of a link folder.
struct LinkedMail {
  std::string identifier;  // in the index; the file name is made from it
  int64_t time = 0;        // seconds since 1970; negative times count as 0
  std::string flags;       // Maildir letters; all other characters are dropped
  bool isNew = false;      // in "new", otherwise in "cur"
};

// A Maildir of symbolic links to mail, for mail programs:
//
//   DIR/cur, DIR/new   links; their names have the digest of the identifier
//   DIR/tmp            links and copies until they are published
//   DIR/.tallow-folder marks the directory as ours, and holds copies of messages that have no file
//                      of their own, which links point to
//
// Publishing renames what is new into its place, one message after another as a delivery does, and
// then removes the links of before. The directories themselves stay, because mail programs watch
// them: a program that has the folder open sees the new messages.
//
// Nothing that others have made is removed or replaced: the place must be free, an empty directory,
// or a link folder with nothing else in it. It may not be a symbolic link, or be named with "..".
// The folder is locked while a LinkFolder exists. One thread.
class LinkFolder {
 public:
  // Missing directories are made. Null with an error if the place cannot be used, or if another
  // process works in it for more than ten seconds.
  [[nodiscard]] static std::unique_ptr<LinkFolder> begin(const std::string& path, TLErrorOut error);

  // What was added and not published is removed.
  ~LinkFolder();
  LinkFolder(const LinkFolder&) = delete;
  LinkFolder& operator=(const LinkFolder&) = delete;

  // Adds a link to the file `target`, an absolute path. A message that is added twice counts once.
  bool addLink(const LinkedMail& mail, const std::string& target, TLErrorOut error);
  // Adds a copy of a message.
  bool addCopy(const LinkedMail& mail, std::string_view message, TLErrorOut error);

  // Replaces the content of the folder by what was added. Call it once. After an error the folder
  // may have a part of both.
  bool publish(TLErrorOut error);

  // The absolute path.
  [[nodiscard]] const std::string& path() const { return _path; }

 private:
  LinkFolder(std::string path, platform::FileDescriptor folder)
      : _path(std::move(path)), _folder(std::move(folder)) {}
  bool prepare(TLErrorOut error);
  bool publishLink(const std::string& part, const std::string& name);
  // Removes what is ours in a part, except these.
  void removeOurs(const char* part, const std::set<std::string>& kept);

  const std::string _path;
  const platform::FileDescriptor _folder;
  std::map<std::string, std::set<std::string>> _links;  // names by part
  std::set<std::string> _copies;                        // names
};

}  // namespace cli
