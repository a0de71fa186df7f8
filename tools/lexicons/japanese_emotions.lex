# Japanese emotion words, written for this project (mkbdb's lexicon format: the emotion
# label is the base form of a record of class "unkonwn"). A word is a base form of
# IPADIC: its conjugated forms get the same label ("嬉しい" gives "嬉しく", "嬉しかっ",
# ...); a word written "=word" is that exact form only, and wins over the others.
#
# Negation: the forms of the auxiliary "ない" and of "ず", "ぬ", "ません", "まい" (the
# word "ません" is stored whole in the main database). Exact forms only: "ぬ" also has
# the forms "ね" and "な", which are mostly the final particles of "楽しいですね" and of
# "好きなんだ".
=ない	unkonwn=negation
=なかっ	unkonwn=negation
=なく	unkonwn=negation
=なけれ	unkonwn=negation
=なかろ	unkonwn=negation
=ず	unkonwn=negation
=ぬ	unkonwn=negation
=ません	unkonwn=negation
=まい	unkonwn=negation
# Intensifiers.
=とても	unkonwn=strong adverb
=すごく	unkonwn=strong adverb
=凄く	unkonwn=strong adverb
=非常	unkonwn=strong adverb
=大変	unkonwn=strong adverb
=たいへん	unkonwn=strong adverb
=かなり	unkonwn=strong adverb
=本当	unkonwn=strong adverb
=ほんとう	unkonwn=strong adverb
=ほんと	unkonwn=strong adverb
=めっちゃ	unkonwn=strong adverb
=超	unkonwn=strong adverb
=実に	unkonwn=strong adverb
=極めて	unkonwn=strong adverb
=随分	unkonwn=strong adverb
=ずいぶん	unkonwn=strong adverb
=最も	unkonwn=strong adverb
=もっとも	unkonwn=strong adverb
=ずっと	unkonwn=strong adverb
=一番	unkonwn=strong adverb
=大いに	unkonwn=strong adverb
=心から	unkonwn=strong adverb
=まことに	unkonwn=strong adverb
=誠に	unkonwn=strong adverb
# Praise, thanks, welcome, success, joy.
最高	unkonwn=very positive
素晴らしい	unkonwn=very positive
すばらしい	unkonwn=very positive
大好き	unkonwn=very positive
完璧	unkonwn=very positive
すごい	unkonwn=very positive
凄い	unkonwn=very positive
感動	unkonwn=very positive
おめでとう	unkonwn=very positive
大成功	unkonwn=very positive
見事	unkonwn=very positive
お見事	unkonwn=very positive
大喜び	unkonwn=very positive
光栄	unkonwn=very positive
好き	unkonwn=positive
嬉しい	unkonwn=positive
うれしい	unkonwn=positive
楽しい	unkonwn=positive
たのしい	unkonwn=positive
楽しみ	unkonwn=positive
良い	unkonwn=positive
よい	unkonwn=positive
いい	unkonwn=positive
美しい	unkonwn=positive
綺麗	unkonwn=positive
きれい	unkonwn=positive
可愛い	unkonwn=positive
かわいい	unkonwn=positive
面白い	unkonwn=positive
おもしろい	unkonwn=positive
優しい	unkonwn=positive
やさしい	unkonwn=positive
親切	unkonwn=positive
素敵	unkonwn=positive
すてき	unkonwn=positive
幸せ	unkonwn=positive
幸福	unkonwn=positive
安心	unkonwn=positive
満足	unkonwn=positive
元気	unkonwn=positive
上手	unkonwn=positive
得意	unkonwn=positive
立派	unkonwn=positive
優秀	unkonwn=positive
便利	unkonwn=positive
快適	unkonwn=positive
おいしい	unkonwn=positive
美味しい	unkonwn=positive
うまい	unkonwn=positive
ありがとう	unkonwn=positive
感謝	unkonwn=positive
お礼	unkonwn=positive
ようこそ	unkonwn=positive
いらっしゃい	unkonwn=positive
歓迎	unkonwn=positive
お帰り	unkonwn=positive
おかえり	unkonwn=positive
喜ぶ	unkonwn=positive
喜び	unkonwn=positive
笑う	unkonwn=positive
笑顔	unkonwn=positive
微笑む	unkonwn=positive
成功	unkonwn=positive
合格	unkonwn=positive
勝つ	unkonwn=positive
勝利	unkonwn=positive
優勝	unkonwn=positive
達成	unkonwn=positive
解決	unkonwn=positive
助かる	unkonwn=positive
誇り	unkonwn=positive
尊敬	unkonwn=positive
愛する	unkonwn=positive
気に入る	unkonwn=positive
落ち着く	unkonwn=positive
楽	unkonwn=positive
順調	unkonwn=positive
大丈夫	unkonwn=positive
正しい	unkonwn=positive
正解	unkonwn=positive
賛成	unkonwn=positive
わくわく	unkonwn=positive
# Failure, apology, sadness, anger, fear, pain.
嫌い	unkonwn=negative
嫌	unkonwn=negative
いや	unkonwn=negative
悲しい	unkonwn=negative
かなしい	unkonwn=negative
寂しい	unkonwn=negative
さびしい	unkonwn=negative
怖い	unkonwn=negative
こわい	unkonwn=negative
恐い	unkonwn=negative
痛い	unkonwn=negative
辛い	unkonwn=negative
つらい	unkonwn=negative
苦しい	unkonwn=negative
悔しい	unkonwn=negative
残念	unkonwn=negative
心配	unkonwn=negative
不安	unkonwn=negative
不満	unkonwn=negative
悪い	unkonwn=negative
わるい	unkonwn=negative
下手	unkonwn=negative
困る	unkonwn=negative
怒る	unkonwn=negative
泣く	unkonwn=negative
失敗	unkonwn=negative
負ける	unkonwn=negative
敗北	unkonwn=negative
退屈	unkonwn=negative
つまらない	unkonwn=negative
疲れる	unkonwn=negative
まずい	unkonwn=negative
がっかり	unkonwn=negative
落ち込む	unkonwn=negative
壊れる	unkonwn=negative
壊す	unkonwn=negative
故障	unkonwn=negative
不具合	unkonwn=negative
間違い	unkonwn=negative
間違える	unkonwn=negative
誤り	unkonwn=negative
エラー	unkonwn=negative
ばか	unkonwn=negative
馬鹿	unkonwn=negative
迷惑	unkonwn=negative
面倒	unkonwn=negative
不便	unkonwn=negative
危険	unkonwn=negative
危ない	unkonwn=negative
失礼	unkonwn=negative
いらいら	unkonwn=negative
イライラ	unkonwn=negative
邪魔	unkonwn=negative
駄目	unkonwn=negative
だめ	unkonwn=negative
ダメ	unkonwn=negative
無理	unkonwn=negative
病気	unkonwn=negative
怪我	unkonwn=negative
事故	unkonwn=negative
恥ずかしい	unkonwn=negative
ごめん	unkonwn=negative
ごめんなさい	unkonwn=negative
=すみません	unkonwn=negative
=申し訳ありません	unkonwn=negative
=申し訳ございません	unkonwn=negative
お悔やみ	unkonwn=negative
最悪	unkonwn=very negative
大嫌い	unkonwn=very negative
ひどい	unkonwn=very negative
酷い	unkonwn=very negative
最低	unkonwn=very negative
絶望	unkonwn=very negative
恐ろしい	unkonwn=very negative
憎む	unkonwn=very negative
