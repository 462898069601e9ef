// A broadcast extension in sample mode: sends what it is given to a streaming server, live.

#include "LiveUpload.h"

int main() {
  av_log_set_level(AV_LOG_ERROR);
  return quorvel::runExtension<upload::LiveUpload>();
}
