// Writes the description of the web API to standard output, for the build. Fails when texts are missing or left over.
#include "webapi/openapi/OpenApi.h"

#include <cstdio>
#include <iostream>

int main()
{
    const auto problems = webapi::openApiProblems();
    for (const std::string &problem : problems)
        fprintf(stderr, "%s\n", problem.c_str());
    std::cout << webapi::openApi().toStyledString();
    return std::cout.good() ? 0 : 1;
}
