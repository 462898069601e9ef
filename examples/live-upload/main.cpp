// A broadcast extension in sample mode: sends what it is given to a streaming server, live.

#include "LibraryLog.h"
#include "LiveUpload.h"

int main() {
  upload::LibraryLog::install();
  return quorvel::runExtension<upload::LiveUpload>();
}
