from cases import *
import cases
class T(PairTest):
    def test(self):
        one,two=self.one,self.two
        self.make_lun("source", 16)
        def show():
            print(two.run("env", "TGT_IPC_SOCKET=/run/iscsi-host/tgtd-rw.sock", "tgtadm", "--op", "show", "--mode", "target",check=False).stdout, two.run("env", "TGT_IPC_SOCKET=/run/iscsi-host/tgtd-rw.sock", "tgtadm", "--op", "show", "--mode", "account",check=False).stdout)
        for i in range(2):
            r=one.run("iscsictl","lun","remote-clone","source","--node",two.address,"--name","copy","--location",VOLUME,"--watch",check=False)
            print(r); show(); print(two.iscsictl("lun","list","--status"))
            print(two.run("iscsictl","lun","delete","copy","--yes",check=False)); show()
import atexit
T.tearDown=lambda self: (time.sleep(1.5), print("\n".join(["ONE"]+self.one.log_lines+["TWO"]+self.two.log_lines)))
import time
main()
