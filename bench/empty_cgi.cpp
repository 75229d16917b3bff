// What a CGI program in C++ costs before it does anything.
#include <iostream>

int main()
{
    std::cout << "Status: 200\r\nContent-Type: application/json\r\n\r\n{}\n";
}
