#include "platform/mp4/Salvage.h"
