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

  std::function<bool(const std::string&)> fileExistsAtPathBlock;
  std::function<bool(const std::string&, bool*)> fileExistsAtPathIsDirectoryBlock;
  std::function<bool(const URLPtr&, const URLPtr&, ErrorPtr*)> moveItemAtURLBlock;
  std::function<bool(const std::string&, const std::string&, ErrorPtr*)> moveItemAtPathBlock;
  std::function<bool(const URLPtr&, const URLPtr&, ErrorPtr*)> copyItemAtURLBlock;
  std::function<bool(const std::string&, const std::string&, ErrorPtr*)> copyItemAtPathBlock;
  std::function<bool(const URLPtr&, ErrorPtr*)> removeItemAtURLBlock;
  std::function<bool(const std::string&, ErrorPtr*)> removeItemAtPathBlock;
  std::function<std::vector<std::string>(const std::string&, ErrorPtr*)>
      contentsOfDirectoryAtPathBlock;
  std::function<Data(const std::string&)> contentsAtPathBlock;
  std::function<std::vector<URLPtr>(const URLPtr&, const std::vector<std::string>&,
                                    NSDirectoryEnumerationOptions, ErrorPtr*)>
      contentsOfDirectoryAtURLBlock;
  std::function<bool(const URLPtr&, bool, const Dictionary&, ErrorPtr*)> createDirectoryAtURLBlock;
  std::function<bool(const std::string&, bool, const Dictionary&, ErrorPtr*)>
      createDirectoryAtPathBlock;
  std::function<bool(const std::string&, const Data&, const Dictionary&)> createFileAtPathBlock;
  std::function<std::vector<URLPtr>(NSSearchPathDirectory, NSSearchPathDomainMask)>
      urlsForDirectoryAndDomainBlock;
  std::function<Dictionary(const std::string&, ErrorPtr*)> attributesOfItemAtPathBlock;
  std::function<URLPtr(NSSearchPathDirectory, NSSearchPathDomainMask, const URLPtr&, bool,
                       ErrorPtr*)>
      urlForDirectoryBlock;
  std::function<URLPtr(const std::string&)> homeDirectoryForUserBlock;
  std::function<bool(const std::string&, const std::string&, ErrorPtr*)> linkItemAtPathBlock;
  std::function<std::string(const std::string&)> displayNameAtPathBlock;
  std::function<std::string(const std::string&)> destinationOfSymbolicLinkBlock;
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
