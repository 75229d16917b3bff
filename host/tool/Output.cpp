#include "Output.h"

#include "iscsihost/host.h"

#include <cstdio>
#include <iostream>
#include <json/json.h>

int check(const char *what, int code)
{
    if (code)
        fprintf(stderr, "iscsi-host: %s failed: error %d: %s\n", what, code, iscsi_host_last_error());
    return code ? 1 : 0;
}

int refuse(const std::string &why)
{
    fprintf(stderr, "iscsi-host: %s\n", why.c_str());
    return 1;
}

void printJson(const Json::Value &value)
{
    std::cout << value.toStyledString();
}
