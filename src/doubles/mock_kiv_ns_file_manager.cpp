#include "kivi/doubles/mock_kiv_ns_file_manager.h"

#include <cstdlib>

#include "kivi/net/url.h"

namespace kivi {

bool MockKivNSFileManager::fileExistsAtPath(const std::string& path) {
  return fileExistsAtPathBlock ? fileExistsAtPathBlock(path) : false;
}

bool MockKivNSFileManager::fileExistsAtPath(const std::string& path, bool* isDirectory) {
  return fileExistsAtPathIsDirectoryBlock ? fileExistsAtPathIsDirectoryBlock(path, isDirectory)
                                          : false;
}

bool MockKivNSFileManager::moveItemAtURL(const URLPtr& srcURL, const URLPtr& dstURL,
                                         ErrorPtr* error) {
  return moveItemAtURLBlock ? moveItemAtURLBlock(srcURL, dstURL, error) : false;
}

bool MockKivNSFileManager::moveItemAtPath(const std::string& srcPath, const std::string& dstPath,
                                          ErrorPtr* error) {
  return moveItemAtPathBlock ? moveItemAtPathBlock(srcPath, dstPath, error) : false;
}

bool MockKivNSFileManager::copyItemAtURL(const URLPtr& srcURL, const URLPtr& dstURL,
                                         ErrorPtr* error) {
  return copyItemAtURLBlock ? copyItemAtURLBlock(srcURL, dstURL, error) : false;
}

bool MockKivNSFileManager::copyItemAtPath(const std::string& srcPath, const std::string& dstPath,
                                          ErrorPtr* error) {
  return copyItemAtPathBlock ? copyItemAtPathBlock(srcPath, dstPath, error) : false;
}

bool MockKivNSFileManager::removeItemAtURL(const URLPtr& url, ErrorPtr* error) {
  return removeItemAtURLBlock ? removeItemAtURLBlock(url, error) : false;
}

bool MockKivNSFileManager::removeItemAtPath(const std::string& path, ErrorPtr* error) {
  return removeItemAtPathBlock ? removeItemAtPathBlock(path, error) : false;
}

std::vector<std::string> MockKivNSFileManager::contentsOfDirectoryAtPath(const std::string& path,
                                                                         ErrorPtr* error) {
  if (contentsOfDirectoryAtPathBlock) return contentsOfDirectoryAtPathBlock(path, error);
  return {};
}

Data MockKivNSFileManager::contentsAtPath(const std::string& path) {
  return contentsAtPathBlock ? contentsAtPathBlock(path) : Data{};
}

std::vector<URLPtr> MockKivNSFileManager::contentsOfDirectoryAtURL(
    const URLPtr& url, const std::vector<std::string>& keys, NSDirectoryEnumerationOptions options,
    ErrorPtr* error) {
  if (contentsOfDirectoryAtURLBlock)
    return contentsOfDirectoryAtURLBlock(url, keys, options, error);
  return {};
}

bool MockKivNSFileManager::createDirectoryAtURL(const URLPtr& url, bool createIntermediates,
                                                const Dictionary& attributes, ErrorPtr* error) {
  return createDirectoryAtURLBlock
             ? createDirectoryAtURLBlock(url, createIntermediates, attributes, error)
             : false;
}

bool MockKivNSFileManager::createDirectoryAtPath(const std::string& path, bool createIntermediates,
                                                 const Dictionary& attributes, ErrorPtr* error) {
  return createDirectoryAtPathBlock
             ? createDirectoryAtPathBlock(path, createIntermediates, attributes, error)
             : false;
}

bool MockKivNSFileManager::createFileAtPath(const std::string& path, const Data& contents,
                                            const Dictionary& attributes) {
  return createFileAtPathBlock ? createFileAtPathBlock(path, contents, attributes) : false;
}

std::vector<URLPtr> MockKivNSFileManager::URLsForDirectory(NSSearchPathDirectory directory,
                                                           NSSearchPathDomainMask domains) {
  if (urlsForDirectoryAndDomainBlock) return urlsForDirectoryAndDomainBlock(directory, domains);
  return {};
}

URLPtr MockKivNSFileManager::URLForDirectory(NSSearchPathDirectory directory,
                                             NSSearchPathDomainMask domain,
                                             const URLPtr& appropriateForURL, bool create,
                                             ErrorPtr* error) {
  return urlForDirectoryBlock
             ? urlForDirectoryBlock(directory, domain, appropriateForURL, create, error)
             : nullptr;
}

Dictionary MockKivNSFileManager::attributesOfItemAtPath(const std::string& path, ErrorPtr* error) {
  return attributesOfItemAtPathBlock ? attributesOfItemAtPathBlock(path, error) : Dictionary{};
}

URLPtr MockKivNSFileManager::containerURLForSecurityApplicationGroupIdentifier(
    const std::string& groupIdentifier) {
  return containerURLForSecurityApplicationGroupIdentifierBlock
             ? containerURLForSecurityApplicationGroupIdentifierBlock(groupIdentifier)
             : nullptr;
}

URLPtr MockKivNSFileManager::homeDirectoryForUser(const std::string& userName) {
  return homeDirectoryForUserBlock ? homeDirectoryForUserBlock(userName) : nullptr;
}

bool MockKivNSFileManager::linkItemAtPath(const std::string& srcPath, const std::string& dstPath,
                                          ErrorPtr* error) {
  return linkItemAtPathBlock ? linkItemAtPathBlock(srcPath, dstPath, error) : false;
}

std::string MockKivNSFileManager::displayNameAtPath(const std::string& path) {
  return displayNameAtPathBlock ? displayNameAtPathBlock(path) : "Mock display name";
}

std::string MockKivNSFileManager::destinationOfSymbolicLinkAtPath(const std::string& path) {
  return destinationOfSymbolicLinkBlock ? destinationOfSymbolicLinkBlock(path) : std::string();
}

URLPtr MockKivNSFileManager::temporaryDirectory() const {
  if (temporaryDirectoryURL) return temporaryDirectoryURL;
  // The platform's rule: $TMPDIR when set, else /tmp; always ending in "/".
  const char* env = std::getenv("TMPDIR");
  std::string dir = env && *env ? env : "/tmp";
  if (dir.back() != '/') dir.push_back('/');
  return URL::fileURLWithPath(dir);
}

}  // namespace kivi
