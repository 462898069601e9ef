// A broadcast extension in clip mode: puts the clips on an HTTP server as an HLS stream.

#include <curl/curl.h>

#include "ClipUpload.h"

int main() {
  av_log_set_level(AV_LOG_ERROR);
  curl_global_init(CURL_GLOBAL_DEFAULT);
  const int status = quorvel::runExtension<upload::ClipUpload>();
  curl_global_cleanup();
  return status;
}
