// MockKivNSFileManager: a scriptable KivNSFileManagerProtocol.
//
// Every operation answers its callback, which also decides what the
// out-parameters (error, isDirectory) receive. Without a callback nothing
// touches the file system: yes/no answers are false, lists, maps and data
// empty, URLs null, out-parameters left as they were; except that
// displayNameAtPath() answers "Mock display name",
// destinationOfSymbolicLinkAtPath() answers "", and temporaryDirectory()
// answers temporaryDirectoryURL or, while that is null, the real temporary
// directory ($TMPDIR, else /tmp, as a directory URL).
//
//   auto files = std::make_shared<kivi::MockKivNSFileManager>();
//   files->fileExistsAtPathBlock = [](const std::string& p) { return p == "/etc/app.conf"; };
//   files->temporaryDirectoryURL = kivi::URL::fileURLWithPath(scratch + "/");
//   cache.setFileManager(files);
//
// Thread contract: none; callbacks run synchronously on the calling thread.
// Set the callbacks before handing the double out.
#pragma once

#include <functional>
#include <string>
#include <vector>

#include "kivi/base/object.h"
#include "kivi/export.h"
#include "kivi/platform/kiv_ns_file_manager_protocol.h"

namespace kivi {

class KIVI_EXPORT MockKivNSFileManager : public Object, public KivNSFileManagerProtocol {
 public:
  MockKivNSFileManager() = default;

  // Answers fileExistsAtPath(path); without it, false.
  std::function<bool(const std::string&)> fileExistsAtPathBlock;
  // Answers fileExistsAtPath(path, isDirectory) and sets `*isDirectory` itself; without it, false.
  std::function<bool(const std::string&, bool*)> fileExistsAtPathIsDirectoryBlock;
  // Answers moveItemAtURL(srcURL, dstURL, error); without it, false.
  std::function<bool(const URLPtr&, const URLPtr&, ErrorPtr*)> moveItemAtURLBlock;
  // Answers moveItemAtPath(srcPath, dstPath, error); without it, false.
  std::function<bool(const std::string&, const std::string&, ErrorPtr*)> moveItemAtPathBlock;
  // Answers copyItemAtURL(srcURL, dstURL, error); without it, false.
  std::function<bool(const URLPtr&, const URLPtr&, ErrorPtr*)> copyItemAtURLBlock;
  // Answers copyItemAtPath(srcPath, dstPath, error); without it, false.
  std::function<bool(const std::string&, const std::string&, ErrorPtr*)> copyItemAtPathBlock;
  // Answers removeItemAtURL(url, error); without it, false.
  std::function<bool(const URLPtr&, ErrorPtr*)> removeItemAtURLBlock;
  // Answers removeItemAtPath(path, error); without it, false.
  std::function<bool(const std::string&, ErrorPtr*)> removeItemAtPathBlock;
  // Answers contentsOfDirectoryAtPath(path, error); without it, an empty list.
  std::function<std::vector<std::string>(const std::string&, ErrorPtr*)>
      contentsOfDirectoryAtPathBlock;
  // Answers contentsAtPath(path); without it, empty data.
  std::function<Data(const std::string&)> contentsAtPathBlock;
  // Answers contentsOfDirectoryAtURL(url, keys, options, error); without it, an empty list.
  std::function<std::vector<URLPtr>(const URLPtr&, const std::vector<std::string>&,
                                    NSDirectoryEnumerationOptions, ErrorPtr*)>
      contentsOfDirectoryAtURLBlock;
  // Answers createDirectoryAtURL(url, createIntermediates, attributes, error); without it, false.
  std::function<bool(const URLPtr&, bool, const Dictionary&, ErrorPtr*)> createDirectoryAtURLBlock;
  // Answers createDirectoryAtPath(path, createIntermediates, attributes, error); without it, false.
  std::function<bool(const std::string&, bool, const Dictionary&, ErrorPtr*)>
      createDirectoryAtPathBlock;
  // Answers createFileAtPath(path, contents, attributes); without it, false.
  std::function<bool(const std::string&, const Data&, const Dictionary&)> createFileAtPathBlock;
  // Answers URLsForDirectory(directory, domains); without it, an empty list.
  std::function<std::vector<URLPtr>(NSSearchPathDirectory, NSSearchPathDomainMask)>
      urlsForDirectoryAndDomainBlock;
  // Answers attributesOfItemAtPath(path, error); without it, an empty map.
  std::function<Dictionary(const std::string&, ErrorPtr*)> attributesOfItemAtPathBlock;
  // Answers URLForDirectory(directory, domain, appropriateForURL, create, error); without it, null.
  std::function<URLPtr(NSSearchPathDirectory, NSSearchPathDomainMask, const URLPtr&, bool,
                       ErrorPtr*)>
      urlForDirectoryBlock;
  // Answers homeDirectoryForUser(userName); without it, null.
  std::function<URLPtr(const std::string&)> homeDirectoryForUserBlock;
  // Answers linkItemAtPath(srcPath, dstPath, error); without it, false.
  std::function<bool(const std::string&, const std::string&, ErrorPtr*)> linkItemAtPathBlock;
  // Answers displayNameAtPath(path); without it, "Mock display name".
  std::function<std::string(const std::string&)> displayNameAtPathBlock;
  // Answers destinationOfSymbolicLinkAtPath(path); without it, "".
  std::function<std::string(const std::string&)> destinationOfSymbolicLinkBlock;
  // Answers containerURLForSecurityApplicationGroupIdentifier(groupIdentifier); without it, null.
  std::function<URLPtr(const std::string&)> containerURLForSecurityApplicationGroupIdentifierBlock;
  // What temporaryDirectory() answers; null: the real temporary directory.
  URLPtr temporaryDirectoryURL;

  std::string description() const override { return Object::description(); }

  bool fileExistsAtPath(const std::string& path) override;
  bool fileExistsAtPath(const std::string& path, bool* isDirectory) override;
  bool moveItemAtURL(const URLPtr& srcURL, const URLPtr& dstURL, ErrorPtr* error) override;
  bool moveItemAtPath(const std::string& srcPath, const std::string& dstPath,
                      ErrorPtr* error) override;
  bool copyItemAtURL(const URLPtr& srcURL, const URLPtr& dstURL, ErrorPtr* error) override;
  bool copyItemAtPath(const std::string& srcPath, const std::string& dstPath,
                      ErrorPtr* error) override;
  bool removeItemAtURL(const URLPtr& url, ErrorPtr* error) override;
  bool removeItemAtPath(const std::string& path, ErrorPtr* error) override;
  std::vector<std::string> contentsOfDirectoryAtPath(const std::string& path,
                                                     ErrorPtr* error) override;
  Data contentsAtPath(const std::string& path) override;
  std::vector<URLPtr> contentsOfDirectoryAtURL(const URLPtr& url,
                                               const std::vector<std::string>& keys,
                                               NSDirectoryEnumerationOptions options,
                                               ErrorPtr* error) override;
  bool createDirectoryAtURL(const URLPtr& url, bool createIntermediates,
                            const Dictionary& attributes, ErrorPtr* error) override;
  bool createDirectoryAtPath(const std::string& path, bool createIntermediates,
                             const Dictionary& attributes, ErrorPtr* error) override;
  bool createFileAtPath(const std::string& path, const Data& contents,
                        const Dictionary& attributes) override;
  std::vector<URLPtr> URLsForDirectory(NSSearchPathDirectory directory,
                                       NSSearchPathDomainMask domains) override;
  URLPtr URLForDirectory(NSSearchPathDirectory directory, NSSearchPathDomainMask domain,
                         const URLPtr& appropriateForURL, bool create, ErrorPtr* error) override;
  Dictionary attributesOfItemAtPath(const std::string& path, ErrorPtr* error) override;
  URLPtr containerURLForSecurityApplicationGroupIdentifier(
      const std::string& groupIdentifier) override;
  URLPtr homeDirectoryForUser(const std::string& userName) override;
  bool linkItemAtPath(const std::string& srcPath, const std::string& dstPath,
                      ErrorPtr* error) override;
  std::string displayNameAtPath(const std::string& path) override;
  std::string destinationOfSymbolicLinkAtPath(const std::string& path) override;
  URLPtr temporaryDirectory() const override;
};

}  // namespace kivi
