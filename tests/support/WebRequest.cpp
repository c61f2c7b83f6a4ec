#include "tests/support/WebRequest.h"

namespace vesk::test {

namespace {

std::size_t appendBody(char* data, std::size_t, std::size_t size, void* answer) {
  static_cast<WebAnswer*>(answer)->body.append(data, size);
  return size;
}

}  // namespace

WebAnswer WebClient::perform(const std::string& method, const std::string& url,
                             const std::vector<std::string>& headers, const std::string* body) {
  WebAnswer answer;
  CURL* curl = _curl.get();
  curl_easy_reset(curl);
  curl_easy_setopt(curl, CURLOPT_URL, url.c_str());
  curl_easy_setopt(curl, CURLOPT_NOSIGNAL, 1L);
  curl_easy_setopt(curl, CURLOPT_PROXY, "");
  curl_easy_setopt(curl, CURLOPT_TIMEOUT_MS, 10'000L);
  curl_easy_setopt(curl, CURLOPT_WRITEFUNCTION, &appendBody);
  curl_easy_setopt(curl, CURLOPT_WRITEDATA, &answer);
  if (!_authorityFile.empty()) curl_easy_setopt(curl, CURLOPT_CAINFO, _authorityFile.c_str());
  if (body) {
    curl_easy_setopt(curl, CURLOPT_POSTFIELDSIZE_LARGE, static_cast<curl_off_t>(body->size()));
    curl_easy_setopt(curl, CURLOPT_POSTFIELDS, body->data());
  }
  curl_easy_setopt(curl, CURLOPT_CUSTOMREQUEST, method.c_str());
  curl_slist* list = nullptr;
  for (const auto& header : headers) list = curl_slist_append(list, header.c_str());
  curl_easy_setopt(curl, CURLOPT_HTTPHEADER, list);
  answer.outcome = curl_easy_perform(curl);
  curl_easy_getinfo(curl, CURLINFO_RESPONSE_CODE, &answer.status);
  curl_easy_setopt(curl, CURLOPT_HTTPHEADER, nullptr);
  curl_slist_free_all(list);
  return answer;
}

}  // namespace vesk::test
