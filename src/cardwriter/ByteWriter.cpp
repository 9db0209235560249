#include "ByteWriter.h"
